// Checked arguments of API calls: buffers with a length, and in/out lengths.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <span>

#include "tee/core/panic.h"
#include "tee/device/secret_bytes.h"

namespace tee {

// input_bytes: an input buffer of the API function `call`; panics for null with a length.
inline std::span<const uint8_t> input_bytes(const char* call, const char* name, const void* data,
                                            size_t length) {
  if (!data && length > 0) panic(call, "%s is null with length %zu", name, length);
  return {static_cast<const uint8_t*>(data), length};
}

// An output buffer with its in/out length: capacity on entry; the number of bytes written, or
// needed, on return.
class output_buffer {
 public:
  // Panics when `length` is null, or `data` is null with a capacity.
  output_buffer(const char* call, const char* name, void* data, size_t* length)
      : data_(static_cast<uint8_t*>(data)), length_(length) {
    if (!length) panic(call, "the length of %s is null", name);
    if (!data && *length > 0) panic(call, "%s is null with capacity %zu", name, *length);
  }

  uint8_t* data() const { return data_; }
  size_t capacity() const { return *length_; }

  // reserve: TEE_ERROR_SHORT_BUFFER, with the length set to `needed`, when that exceeds the
  // capacity.
  [[nodiscard]] TEE_Result reserve(size_t needed) {
    if (needed <= *length_) return TEE_SUCCESS;
    *length_ = needed;
    return TEE_ERROR_SHORT_BUFFER;
  }

  void set_length(size_t written) { *length_ = written; }

  // fill: reserves room for `bytes` and writes them.
  [[nodiscard]] TEE_Result fill(std::span<const uint8_t> bytes);

 private:
  uint8_t* data_;
  size_t* length_;
};

// require_own: panics when the bytes share memory with a parameter of the entry point that runs.
void require_own(const char* call, const char* name, const void* data, size_t length);

// require_own_output: the same in the strict profile, for outputs that the standard does not let be
// the client's.
void require_own_output(const char* call, const char* name, const void* data, size_t length);

// May input and output of a computation begin at the same place?
enum class same_place { ALLOWED, FORBIDDEN };

// require_apart: panics in the strict profile when they share memory in another way.
void require_apart(const char* call, std::span<const uint8_t> input, const uint8_t* output,
                   size_t output_length, same_place rule);

// What a computation reads while it writes `output_length` bytes to `output`: the input in place
// when that is safe, else a copy. In the very same place it is safe when every byte is read before
// it is written (`same_place_is_safe`).
class steady_input {
 public:
  steady_input(std::span<const uint8_t> input, const uint8_t* output, size_t output_length,
               bool same_place_is_safe);
  std::span<const uint8_t> bytes() const { return bytes_; }

 private:
  secret_bytes copy_;
  std::span<const uint8_t> bytes_;
};

}  // namespace tee
