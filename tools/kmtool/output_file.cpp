// Writing of files.
#include "output_file.h"

#include <cerrno>
#include <climits>
#include <csignal>
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

// Temporary files that exist now. A call has few outputs; a path that is too long to be noted here
// cannot be made either.
class leftover_list {
 public:
  void add(const std::string& path) {
    for (auto& slot : paths_) {
      if (slot[0] != 0 || path.size() >= sizeof(slot)) continue;
      memcpy(slot, path.c_str(), path.size() + 1);
      return;
    }
  }

  void remove(const std::string& path) {
    for (auto& slot : paths_) {
      if (path == slot) slot[0] = 0;
    }
  }

  // For a signal handler.
  void unlink_all() {
    for (const auto& slot : paths_) {
      if (slot[0] != 0) unlink(slot);
    }
  }

 private:
  char paths_[4][PATH_MAX] = {};
};
leftover_list leftovers;

constexpr int ENDING[] = {SIGHUP, SIGINT, SIGTERM, SIGPIPE};

// Keeps the signals that end the tool away while it changes what they would have to remove.
class signals_held {
 public:
  signals_held() {
    sigset_t ending;
    sigemptyset(&ending);
    for (const int signal : ENDING)
      sigaddset(&ending, signal);
    sigprocmask(SIG_BLOCK, &ending, &before_);
  }
  signals_held(const signals_held&) = delete;
  signals_held& operator=(const signals_held&) = delete;
  ~signals_held() { sigprocmask(SIG_SETMASK, &before_, nullptr); }

 private:
  sigset_t before_{};
};

// Reset to its default by now: the signal ends the tool as if nobody had looked.
void end_without_leftovers(int signal) {
  leftovers.unlink_all();
  raise(signal);
}

}  // namespace

void leave_nothing_behind() {
  struct sigaction action {};
  action.sa_handler = end_without_leftovers;
  action.sa_flags = static_cast<int>(SA_RESETHAND);
  for (const int signal : ENDING) {
    struct sigaction before {};
    if (sigaction(signal, nullptr, &before) == 0 && before.sa_handler != SIG_IGN) {
      sigaction(signal, &action, nullptr);
    }
  }
}

output_file::output_file(const std::string& path, access mode)
    : name_(path == "-" ? "standard output" : path), mode_(mode_of(mode)) {
  struct stat status {};
  if (path == "-") {
    fd_ = dup(STDOUT_FILENO);
  } else if (stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
    if (S_ISDIR(status.st_mode)) throw failure(WRONG_USAGE, path + " is a folder");
    fd_ = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  } else {
    target_ = target_of(path);
    if (stat(target_.c_str(), &status) == 0) {
      mode_ = status.st_mode & 07777;
      owner_ = status.st_uid;
      group_ = status.st_gid;
    }
    temporary_ = target_ + ".XXXXXX";
    const signals_held held;
    fd_ = mkostemp(temporary_.data(), O_CLOEXEC);
    if (fd_ >= 0) leftovers.add(temporary_);
  }
  if (fd_ < 0) fail_errno(name_);
}

output_file::~output_file() {
  if (fd_ >= 0) ::close(fd_);
  if (target_.empty() || temporary_.empty()) return;
  const signals_held held;
  unlink(temporary_.c_str());
  leftovers.remove(temporary_);
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

// A group that the user is not in cannot be given; the owner is what counts.
void output_file::keep_owner() {
  if (!owner_ || fchown(fd_, *owner_, group_) == 0) return;
  if (*owner_ == geteuid() || fchown(fd_, *owner_, static_cast<gid_t>(-1)) == 0) {
    mode_ &= ~static_cast<mode_t>(S_IRWXG | S_ISUID | S_ISGID);
    return;
  }
  throw failure(WRONG_USAGE, name_ + " belongs to another user, and would not any more",
                "Choose another file, or remove that one first.");
}

void output_file::commit() {
  if (target_.empty()) return;
  keep_owner();
  const signals_held held;
  if (fchmod(fd_, mode_) != 0 || fsync(fd_) != 0 ||
      rename(temporary_.c_str(), target_.c_str()) != 0) {
    fail_errno(name_);
  }
  leftovers.remove(temporary_);
  temporary_.clear();
  sync_folder_of(target_);
}

}  // namespace kmtool
