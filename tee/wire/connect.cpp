// Who serves a device, and an end to that.
#include "tee/wire/connect.h"

#include <array>
#include <poll.h>
#include <span>

#include "tee/wire/os_calls.h"
#include "tee/wire/records.h"
#include "tee/wire/socket.h"

namespace tee::wire {

namespace {

constexpr int LONGEST_END_MS = 20'000;

file_descriptor reach(const std::string& path) {
  const file_descriptor place(os::open_place(path.c_str()));
  return place ? connect_in(place.get(), SOCKET_NAME) : file_descriptor();
}

// Asks for something that takes no greeting.
std::optional<answer> ask(int socket, request kind) {
  std::array<uint8_t, ANSWER_HEADER> packet{};
  writer to{packet};
  to.u32(static_cast<uint32_t>(kind));
  if (!send(socket, std::span(packet).first(to.length()))) return std::nullopt;
  const size_t got = receive(socket, packet);
  reader from{std::span(packet).first(got)};
  const answer came = read_answer(from);
  return from.ok() && came.result == 0 ? std::optional(came) : std::nullopt;
}

}  // namespace

bool is_served(const std::string& path) {
  return static_cast<bool>(reach(path));
}

std::optional<service_status> find_service(const std::string& path) {
  const file_descriptor socket = reach(path);
  if (!socket) return std::nullopt;
  const std::optional<answer> told = ask(socket.get(), request::STATUS);
  if (!told) return std::nullopt;
  return service_status{static_cast<pid_t>(told->number), static_cast<time_t>(told->second)};
}

bool stop_service(const std::string& path) {
  const file_descriptor socket = reach(path);
  if (!socket) return true;
  peer_credentials server{};
  if (!read_peer(socket.get(), &server)) return false;
  const file_descriptor process(os::open_process(server.process));
  if (!ask(socket.get(), request::STOP)) return false;
  pollfd end{process.get(), POLLIN, 0};
  return process && poll(&end, 1, LONGEST_END_MS) == 1;
}

}  // namespace tee::wire
