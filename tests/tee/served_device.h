// A device that a process of its own serves, for as long as this lives.
#pragma once

#include <array>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <gtest/gtest.h>
#include <span>
#include <string>
#include <sys/types.h>
#include <thread>

#include "tee/wire/connect.h"
#include "tee/wire/os_calls.h"
#include "tee/wire/records.h"
#include "tee/wire/socket.h"

namespace tee::test {

class served_device {
 public:
  // Finds the test's trusted applications as well as the tree's.
  explicit served_device(std::string path) : path_(std::move(path)) { start(); }
  served_device(const served_device&) = delete;
  served_device& operator=(const served_device&) = delete;
  ~served_device() { stop(); }

  std::string name() const { return "teed:" + path_; }

  void start() const {
    const std::string command = TEED_PROGRAM " --device " + path_ + " --ta-path " TEST_TA_PATH;
    EXPECT_EQ(std::system(command.c_str()), 0);
  }

  void stop() const {
    ask(wire::request::STOP);
    for (int i = 0; i < 1000 && wire::is_served(path_); i++)
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }

  // kill: and waits until it is gone; zombies, whose parent waits for nobody, are gone too.
  void kill() const {
    ::kill(process(), SIGKILL);
    while (wire::is_served(path_))
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }

  pid_t process() const { return static_cast<pid_t>(ask(wire::request::STATUS).number); }

  file_descriptor connect() const {
    const file_descriptor place(os::open_place(path_.c_str()));
    return wire::connect_in(place.get(), wire::SOCKET_NAME);
  }

 private:
  wire::answer ask(wire::request kind) const {
    const file_descriptor socket = connect();
    if (!socket) return {};
    std::array<uint8_t, wire::MESSAGE_MAX> packet{};
    wire::writer to{packet};
    to.u32(static_cast<uint32_t>(kind));
    if (!wire::send(socket.get(), std::span(packet).first(to.length()))) return {};
    const size_t got = wire::receive(socket.get(), packet);
    wire::reader from{std::span(packet).first(got)};
    return wire::read_answer(from);
  }

  const std::string path_;
};

}  // namespace tee::test
