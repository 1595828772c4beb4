// The persistent objects of a device: sealed rows (object_rows.h), each held against the replay
// table, so that an old copy of a row, or of the whole database, does not open, and a row that was
// taken away is missed.
#pragma once

#include <mutex>
#include <optional>
#include <span>
#include <vector>

#include "tee/device/object_rows.h"
#include "tee/device/process_mark.h"
#include "tee/device/replay_table.h"

namespace tee {

// Every call may be made from any thread of the process that opened the device, and throws
// storage_error:
// TEE_ERROR_ITEM_NOT_FOUND for a storage that the device does not have; TEE_ERROR_CORRUPT_OBJECT
// when the object fails its check: it is refused, for reading, replacing and removing, and kept as
// it is until forget(); TEE_ERROR_STORAGE_NOT_AVAILABLE when the database is missing, locked,
// damaged, or refused; TEE_ERROR_STORAGE_NO_SPACE; TEE_ERROR_OUT_OF_MEMORY. A change that was
// reported as done is durable. After a power cut, or when a change was reported as failed, the
// object is the old or the new one.
class object_store {
 public:
  // create: makes the empty store of a new device with that key in its folder.
  static void create(const device_folder& folder, const device_key& key);

  // The store of the device with that key, which has replay-protected storage or not. The folder
  // must outlive it. Throws device_error, DAMAGED when database or replay table are not the
  // device's, or storage_error.
  object_store(const device_folder& folder, const device_key& key, bool has_rpmb);

  // load: the content of an object; nothing when there is none.
  std::optional<secret_bytes> load(const object_name& name);

  // save: creates or replaces an object.
  void save(const object_name& name, std::span<const uint8_t> content);

  // remove: the object is gone afterwards, whether or not it was there.
  void remove(const object_name& name);

  // check: all objects that fail their check. Changes nothing.
  std::vector<damaged_object> check();

  // forget: the same as remove, for an object that may fail its check: row and entry go.
  void forget(const object_name& name);

 private:
  template <typename F>
  auto guarded(F action);
  void require_storage(const object_name& name) const;
  std::string judge(const object_name& name, const std::optional<object_rows::row>& row,
                    std::optional<secret_bytes>* content) const;
  std::optional<secret_bytes> current(const object_name& name);
  template <typename F>
  void change(const object_name& name, bool present, F write);

  std::mutex mutex_;
  const process_mark opened_in_;  // a process that was forked from it is not the device's user
  const bool has_rpmb_;
  object_rows rows_;
  replay_table replay_;
};

}  // namespace tee
