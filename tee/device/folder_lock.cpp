// The lock of a device folder. The kernel's file lock decides, and ends with the process however it
// ends; the text in the file only tells others who holds it.
#include "tee/device/folder_lock.h"

#include <cerrno>
#include <charconv>
#include <csignal>
#include <ctime>
#include <unistd.h>

#include "tee/device/os_open.h"

namespace tee {

namespace {

// The process named in the lock file; 0 when there is none alive.
pid_t named_holder(int fd) {
  char text[16] = {};
  ssize_t length = pread(fd, text, sizeof(text) - 1, 0);
  pid_t holder = 0;
  if (length > 0) std::from_chars(text, text + length, holder);
  bool alive = holder > 0 && (kill(holder, 0) == 0 || errno == EPERM);
  return alive ? holder : 0;
}

// A holder writes its id right after it got the lock, so an absent one is given a moment to appear.
std::string holder_text(int fd) {
  constexpr timespec MOMENT = {0, 5'000'000};
  for (int tries = 0; tries < 20; tries++) {
    if (pid_t holder = named_holder(fd)) return "process " + std::to_string(holder);
    nanosleep(&MOMENT, nullptr);
  }
  return "another process";
}

}  // namespace

folder_lock::folder_lock(const std::string& folder) {
  const std::string path = folder + "/lock";
  file_ = file_descriptor(os::open_file(path.c_str(), os::open_mode::READWRITE));
  if (!file_) throw file_error("open", path);
  if (os::lock_file(file_.get()) != 0) {
    if (errno != EWOULDBLOCK) throw file_error("lock", path);
    throw device_error(device_error::kind::BUSY,
                       "device " + folder + " is in use by " + holder_text(file_.get()));
  }
  // A full disk takes the courtesy of the name away, not the device.
  const std::string own = std::to_string(getpid()) + "\n";
  if (ftruncate(file_.get(), 0) != 0 || pwrite(file_.get(), own.data(), own.size(), 0) < 0) return;
}

folder_lock::~folder_lock() {
  // The name goes before the lock, or the next holder would be taken for this one.
  if (ftruncate(file_.get(), 0) != 0) return;
}

}  // namespace tee
