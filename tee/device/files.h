// Files: owned descriptors, read whole, errors with their reason.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "tee/device/device.h"
#include "tee/device/file_descriptor.h"
#include "tee/device/secret_bytes.h"

namespace tee {

// An operating system call on a file failed; error_number() is its errno.
class file_error : public device_error {
 public:
  // Says what was tried on which path, and takes the reason from errno.
  file_error(const std::string& action, const std::string& path);
  int error_number() const { return error_number_; }

 private:
  file_error(const std::string& action, const std::string& path, int error_number);
  int error_number_;
};

// read_all: what is left to read of `file`. DAMAGED when that is more than `limit` bytes, else
// file_error; `path` is what errors name.
secret_bytes read_all(const file_descriptor& file, size_t limit, const std::string& path);

// read_file: the content of the regular file `path`; nothing when there is none. Fails as read_all.
std::optional<secret_bytes> read_file(const std::string& path, size_t limit);

// write_all: appends the bytes to what was written to `file`.
void write_all(const file_descriptor& file, std::span<const uint8_t> bytes,
               const std::string& path);

// as_bytes: the characters of a text as bytes.
inline std::span<const uint8_t> as_bytes(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

}  // namespace tee
