// Calls of the system whose headers lead to <fcntl.h>.
#include "tee/wire/os_calls.h"

#include <cerrno>
#include <cstdint>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace os {

namespace {

constexpr int FIXED = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;

}  // namespace

int make_shared_memory(size_t size) {
  const int fd = memfd_create("tee", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  if (fd < 0) return -1;
  if (ftruncate(fd, static_cast<off_t>(size)) == 0 && fcntl(fd, F_ADD_SEALS, FIXED) == 0) return fd;
  const int reason = errno;
  close(fd);
  errno = reason;
  return -1;
}

bool is_fixed_memory(int fd, size_t size) {
  const int seals = fcntl(fd, F_GET_SEALS);
  struct stat status {};
  return seals >= 0 && (seals & FIXED) == FIXED && fstat(fd, &status) == 0 && status.st_size >= 0 &&
         static_cast<uint64_t>(status.st_size) >= size;
}

int open_place(const char* path) {
  return open(path, O_PATH | O_DIRECTORY | O_CLOEXEC);
}

int open_process(pid_t process) {
  return static_cast<int>(syscall(SYS_pidfd_open, process, 0));  // the C library may lack it
}

}  // namespace os
