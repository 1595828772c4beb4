// Opening and locking files.
#include "tee/device/os_open.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

namespace os {

const int CURRENT_FOLDER = AT_FDCWD;

int open_file(const char* path, open_mode mode, int at) {
  constexpr mode_t PRIVATE = 0600;
  switch (mode) {
    case open_mode::READ:
      return openat(at, path, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    case open_mode::READ_OWN:
      return openat(at, path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW);
    case open_mode::REPLACE:
      return openat(at, path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, PRIVATE);
    case open_mode::CREATE:
      return openat(at, path, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, PRIVATE);
  }
  errno = EINVAL;
  return -1;
}

int open_folder(const char* path, int at) {
  return openat(at, path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

bool may_write(int folder) {
  return faccessat(folder, ".", W_OK | X_OK, AT_EACCESS) == 0;
}

int lock_file(int fd) {
  int result = 0;
  do {
    result = flock(fd, LOCK_EX | LOCK_NB);
  } while (result != 0 && errno == EINTR);
  return result;
}

}  // namespace os
