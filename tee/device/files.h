// Files: owned descriptors, read whole, errors with their reason.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "tee/device/device.h"
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

// Owner of a file descriptor.
class file_descriptor {
 public:
  file_descriptor() = default;
  explicit file_descriptor(int fd) : fd_(fd) {}
  file_descriptor(file_descriptor&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  file_descriptor& operator=(file_descriptor&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  ~file_descriptor();
  int get() const { return fd_; }
  int release() { return std::exchange(fd_, -1); }  // owned no more, and not closed
  explicit operator bool() const { return fd_ >= 0; }

 private:
  int fd_ = -1;
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
