// Open persistent objects: the content that all handles to one object share, the rules by which
// they share it, and each handle's own rights and position.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>

#include "tee/core/stored_object.h"
#include "tee/device/device.h"
#include "tee/device/object_name.h"

namespace tee {

constexpr uint32_t SHARE_FLAGS = TEE_DATA_FLAG_SHARE_READ | TEE_DATA_FLAG_SHARE_WRITE;
constexpr uint32_t ACCESS_FLAGS =
    TEE_DATA_FLAG_ACCESS_READ | TEE_DATA_FLAG_ACCESS_WRITE | TEE_DATA_FLAG_ACCESS_WRITE_META;

// The longest data stream that is kept, in bytes; more is TEE_ERROR_STORAGE_NO_SPACE.
constexpr size_t STREAM_LIMIT = 64 * 1024 * 1024;

// What one handle to a persistent object has. Calls throw std::bad_alloc and nothing else; failures
// of the storage are traced and returned (object_store.h has the codes). Instances of the same
// trusted application may use handles to one object from several threads.
class persistent_stream {
 public:
  // open: TEE_ERROR_ITEM_NOT_FOUND when there is no such object, TEE_ERROR_ACCESS_CONFLICT when the
  // object is open and the flags do not go together, else the storage codes. The device must
  // outlive the result.
  [[nodiscard]] static TEE_Result open(device& dev, const object_name& name, uint32_t flags,
                                       std::shared_ptr<persistent_stream>* stream);

  // create: stores and opens an object; replaces one that is there only with
  // TEE_DATA_FLAG_OVERWRITE, else TEE_ERROR_ACCESS_CONFLICT.
  [[nodiscard]] static TEE_Result create(device& dev, const object_name& name, uint32_t flags,
                                         stored_object content,
                                         std::shared_ptr<persistent_stream>* stream);

  // What open and create make their results with.
  struct shared;
  persistent_stream(std::shared_ptr<shared> object, uint32_t flags);

  persistent_stream(const persistent_stream&) = delete;
  persistent_stream& operator=(const persistent_stream&) = delete;
  ~persistent_stream();

  // flags: the access and sharing flags that it was opened with.
  uint32_t flags() const { return flags_; }

  // size, position: of the data stream, in bytes; the position may lie past the end.
  size_t size() const;
  size_t position() const { return position_; }

  // attributes: what the object was created with; content.data is not meant to be looked at here.
  const stored_object& attributes() const;

  // read: copies from the position on and moves it; returns how many bytes, 0 at or past the end.
  size_t read(std::span<uint8_t> out);

  // write: from the position on, durable on return; zeros fill a gap. All or nothing.
  // TEE_ERROR_OVERFLOW past TEE_DATA_MAX_POSITION.
  [[nodiscard]] TEE_Result write(std::span<const uint8_t> bytes);

  // seek: below 0 becomes 0; TEE_ERROR_OVERFLOW past TEE_DATA_MAX_POSITION. `whence` must be valid.
  [[nodiscard]] TEE_Result seek(intmax_t offset, TEE_Whence whence);

  // remove: takes the object out of the storage. No other handle may have it open.
  [[nodiscard]] TEE_Result remove();

 private:
  struct shared_objects;

  std::shared_ptr<shared> object_;
  uint32_t flags_;
  size_t position_ = 0;
};

}  // namespace tee
