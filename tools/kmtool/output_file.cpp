// Writing of files.
#include "output_file.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>

#include "tool.h"

namespace kmtool {

namespace {

[[noreturn]] void fail_errno(const std::string& path) {
  throw failure(WRONG_USAGE, "cannot write " + path + ": " + strerror(errno));
}

mode_t mode_of(access mode) {
  if (mode == access::PRIVATE) return 0600;
  mode_t mask = umask(0);
  umask(mask);
  return 0666 & ~mask;
}

// The file that a path leads to; it need not be there yet. A circle of links ends at one of them.
std::string target_of(std::filesystem::path path) {
  constexpr int MAX_LINKS = 40;
  std::error_code error;
  for (int links = 0; links < MAX_LINKS && std::filesystem::is_symlink(path, error); ++links) {
    path = path.parent_path() / std::filesystem::read_symlink(path, error);
  }
  return path;
}

// Makes the new name durable; a folder that cannot be synchronised is no reason to call the write
// failed, since the file is there.
void sync_folder_of(const std::string& path) {
  std::string folder = std::filesystem::path(path).parent_path();
  int fd = open(folder.empty() ? "." : folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  fsync(fd);
  ::close(fd);
}

}  // namespace

output_file::output_file(const std::string& path, access mode)
    : name_(path == "-" ? "standard output" : path), mode_(mode) {
  struct stat status {};
  if (path == "-") {
    fd_ = dup(STDOUT_FILENO);
  } else if (stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
    if (S_ISDIR(status.st_mode)) throw failure(WRONG_USAGE, path + " is a folder");
    fd_ = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  } else {
    target_ = target_of(path);
    temporary_ = target_ + ".XXXXXX";
    fd_ = mkostemp(temporary_.data(), O_CLOEXEC);
  }
  if (fd_ < 0) fail_errno(name_);
}

output_file::~output_file() {
  if (fd_ >= 0) ::close(fd_);
  if (!temporary_.empty()) unlink(temporary_.c_str());
}

void output_file::write(keymaster::client::byte_view data) {
  written_ += data.size();
  while (!data.empty()) {
    ssize_t count = ::write(fd_, data.data(), data.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail_errno(name_);
    data = data.subspan(static_cast<size_t>(count));
  }
}

void output_file::commit() {
  if (target_.empty()) return;
  if (fchmod(fd_, mode_of(mode_)) != 0 || fsync(fd_) != 0 ||
      rename(temporary_.c_str(), target_.c_str()) != 0) {
    fail_errno(name_);
  }
  temporary_.clear();
  sync_folder_of(target_);
}

}  // namespace kmtool
