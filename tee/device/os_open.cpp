// Opening and locking files.
#include "tee/device/os_open.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/file.h>

namespace os {

int open_file(const char* path, open_mode mode) {
  constexpr mode_t PRIVATE = 0600;
  switch (mode) {
    case open_mode::READ:
      return open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    case open_mode::REPLACE:
      return open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, PRIVATE);
    case open_mode::READWRITE:
      return open(path, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, PRIVATE);
  }
  errno = EINVAL;
  return -1;
}

int open_folder(const char* path) {
  return open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

int lock_file(int fd) {
  int result = 0;
  do {
    result = flock(fd, LOCK_EX | LOCK_NB);
  } while (result != 0 && errno == EINTR);
  return result;
}

}  // namespace os
