// Going into the background, and what others see of it.
#pragma once

#include <chrono>
#include <string>
#include <sys/types.h>

namespace teed {

// Whoever started the program and waits until the service is ready or has failed.
class starter {
 public:
  starter() = default;  // nobody waits
  starter(const starter&) = delete;
  starter& operator=(const starter&) = delete;
  ~starter();

  // leave: true in the process that was started, which waits for the service; false in the service,
  // a process of its own session. Throws std::system_error.
  [[nodiscard]] bool leave();

  // wait_for_child: how the service began, as an exit status.
  int wait_for_child();

  // log_to: from be_ready on, standard error goes to a fresh file of that name.
  void log_to(const std::string& path) { log_ = path; }

  // be_ready: tells whoever waits, and lets go of his terminal and pipes.
  void be_ready();

 private:
  int pipe_ = -1;
  pid_t child_ = 0;
  std::string log_;
};

// close_strangers: the descriptors that a program was started with, but for the first three.
void close_strangers();

// is_taken: whether a process has the device in that folder.
bool is_taken(const std::string& device);

// How long a service may take from having the folder to taking connections.
constexpr std::chrono::seconds STARTING{2};

// wait_while_starting: whether somebody serves the device, or begins to within STARTING while
// he has it; false when nobody has it.
bool wait_while_starting(const std::string& device);

}  // namespace teed
