// Files: owned descriptors, read whole, errors with their reason.
#include "tee/device/files.h"

#include <algorithm>
#include <cerrno>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

#include "tee/device/os_open.h"

namespace tee {

namespace {

constexpr size_t FIRST_READ = 4096;

size_t read_some(int fd, std::span<uint8_t> room, const std::string& path) {
  for (;;) {
    ssize_t got = read(fd, room.data(), room.size());
    if (got >= 0) return static_cast<size_t>(got);
    if (errno != EINTR) throw file_error("read", path);
  }
}

}  // namespace

file_error::file_error(const std::string& action, const std::string& path)
    : file_error(action, path, errno) {}

file_error::file_error(const std::string& action, const std::string& path, int error_number)
    : device_error(kind::IO, "cannot " + action + " " + path + ": " +
                                 std::generic_category().message(error_number)),
      error_number_(error_number) {}

secret_bytes read_all(const file_descriptor& file, size_t limit, const std::string& path) {
  // Grown as it fills, since the limit may lie far above the file's size.
  secret_bytes bytes;
  size_t filled = 0;
  for (size_t got = 1; got != 0 && filled <= limit; filled += got) {
    if (filled == bytes.size()) bytes.resize(std::min(limit + 1, 2 * filled + FIRST_READ));
    got = read_some(file.get(), std::span(bytes).subspan(filled), path);
  }
  if (filled > limit) throw device_error(device_error::kind::DAMAGED, path + " is too long");
  bytes.resize(filled);
  return bytes;
}

std::optional<secret_bytes> read_file(const std::string& path, size_t limit) {
  file_descriptor file(os::open_file(path.c_str(), os::open_mode::READ));
  if (!file && (errno == ENOENT || errno == ENOTDIR)) return std::nullopt;
  struct stat status {};
  if (!file || fstat(file.get(), &status) != 0) throw file_error("open", path);
  if (!S_ISREG(status.st_mode)) {
    throw device_error(device_error::kind::DAMAGED, path + " is not a regular file");
  }
  return read_all(file, limit, path);
}

void write_all(const file_descriptor& file, std::span<const uint8_t> bytes,
               const std::string& path) {
  while (!bytes.empty()) {
    ssize_t written = write(file.get(), bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) throw file_error("write", path);
    bytes = bytes.subspan(static_cast<size_t>(written));
  }
}

}  // namespace tee
