// Going into the background. Apart from who knows of the TEE: <fcntl.h> declares a function of the
// same name as its namespace.
#include "background.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <sysexits.h>
#include <system_error>
#include <unistd.h>

namespace teed {

namespace {

constexpr int FIRST_STRANGER = 3;

void replace(int descriptor, const char* path, int flags) {
  constexpr mode_t PRIVATE = 0600;
  const int fd = open(path, flags | O_CLOEXEC | O_NOFOLLOW, PRIVATE);
  if (fd < 0) return;
  dup2(fd, descriptor);
  close(fd);
}

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

// An exec leaves ignored and blocked signals as they were; these are to be heard here.
void hear_signals() {
  for (int number : {SIGTERM, SIGINT, SIGHUP, SIGCHLD})
    signal(number, SIG_DFL);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

}  // namespace

starter::~starter() {
  if (pipe_ >= 0) close(pipe_);
}

bool starter::leave() {
  hear_signals();
  int ends[2] = {-1, -1};
  if (pipe2(ends, O_CLOEXEC) != 0) fail("pipe");
  child_ = fork();
  if (child_ < 0) fail("fork");
  const bool parent = child_ > 0;
  close(ends[parent ? 1 : 0]);
  pipe_ = ends[parent ? 0 : 1];
  if (!parent) setsid();
  return parent;
}

int starter::wait_for_child() {
  char byte = 0;
  ssize_t got = 0;
  do {
    got = read(pipe_, &byte, 1);
  } while (got < 0 && errno == EINTR);
  if (got == 1) return EX_OK;
  int status = 0;
  pid_t waited = 0;
  do {
    waited = waitpid(child_, &status, 0);
  } while (waited < 0 && errno == EINTR);
  return waited == child_ && WIFEXITED(status) ? WEXITSTATUS(status) : EX_SOFTWARE;
}

void starter::be_ready() {
  if (pipe_ < 0) return;
  replace(STDIN_FILENO, "/dev/null", O_RDWR);
  replace(STDOUT_FILENO, "/dev/null", O_RDWR);
  replace(STDERR_FILENO, log_.c_str(), O_WRONLY | O_CREAT | O_TRUNC);
  const ssize_t told = write(pipe_, "r", 1);  // who is gone does not wait
  static_cast<void>(told);
  close(pipe_);
  pipe_ = -1;
}

void close_strangers() {
  close_range(FIRST_STRANGER, ~0U, 0);
}

bool is_taken(const std::string& device) {
  const int folder = open(device.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder < 0) return false;
  const bool taken = flock(folder, LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
  close(folder);
  return taken;
}

}  // namespace teed
