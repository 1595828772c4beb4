// Reading of files.
#include "files.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include "tool.h"

namespace kmtool {

namespace {

constexpr char STANDARD_STREAM[] = "-";

[[noreturn]] void fail_errno(const std::string& action, const std::string& path) {
  throw failure(WRONG_USAGE, "cannot " + action + " " + path + ": " + strerror(errno));
}

}  // namespace

void open_standard_streams() {
  for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd) {
    if (fcntl(fd, F_GETFD) >= 0) continue;
    const int flags = fd == STDIN_FILENO ? O_WRONLY : O_RDONLY;
    if (open("/dev/null", flags) < 0) _exit(TEE_FAILED);
  }
}

input_file::input_file(const std::string& path)
    : path_(path == STANDARD_STREAM ? "standard input" : path),
      fd_(path == STANDARD_STREAM ? dup(STDIN_FILENO) : open(path.c_str(), O_RDONLY | O_CLOEXEC)) {
  if (fd_ < 0) fail_errno("read", path_);
  struct stat status {};
  if (fstat(fd_, &status) == 0 && S_ISREG(status.st_mode)) {
    size_ = static_cast<uint64_t>(status.st_size);
  }
}

input_file::~input_file() {
  ::close(fd_);
}

size_t input_file::read(std::span<uint8_t> room) {
  size_t filled = 0;
  while (filled < room.size()) {
    ssize_t count = ::read(fd_, room.data() + filled, room.size() - filled);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail_errno("read", path_);
    if (count == 0) break;
    filled += static_cast<size_t>(count);
  }
  return filled;
}

bytes read_file(const std::string& path, size_t limit) {
  input_file file(path);
  bytes content;
  bytes chunk(4096);
  size_t length = 0;
  do {
    length = file.read(chunk);
    keymaster::client::append(&content, byte_view(chunk).first(length));
  } while (length > 0 && content.size() <= limit);
  if (content.empty()) throw failure(WRONG_USAGE, path + " is empty");
  if (content.size() > limit) {
    throw failure(WRONG_USAGE, path + " is longer than " + std::to_string(limit) + " bytes");
  }
  return content;
}

void write_file(const std::string& path, byte_view data, access mode) {
  output_file file(path, mode);
  file.write(data);
  file.commit();
}

void refuse_overwriting(const std::string& path, const std::string& source) {
  std::error_code ignored;
  namespace fs = std::filesystem;
  if (path == STANDARD_STREAM || !fs::is_regular_file(path, ignored)) return;
  if (!source.empty() && fs::equivalent(path, source, ignored)) return;
  throw failure(WRONG_USAGE, path + " is there already",
                "Choose another file, or give --force to overwrite it.");
}

}  // namespace kmtool
