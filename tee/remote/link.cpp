// A program's tie to the process that serves a device.
#include "tee/remote/link.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include "tee/remote/start.h"
#include "tee/wire/os_calls.h"

namespace tee::remote {

namespace {

TEEC_Result complain(TEEC_Result code, const std::string& what) {
  fprintf(stderr, "[TEE] %s\n", what.c_str());
  return code;
}

// Whoever may write the folder could put a socket there: only its owner and root are believed.
bool is_trusted(int socket, int place) {
  wire::peer_credentials server{};
  struct stat folder {};
  return wire::read_peer(socket, &server) && fstat(place, &folder) == 0 &&
         (server.user == folder.st_uid || server.user == 0);
}

// Greets over a new connection; false when the other end is gone or speaks another version.
bool greet(connection& made, wire::request kind, uint32_t client, wire::answer* answer) {
  wire::writer to(made.packet);
  to.u32(static_cast<uint32_t>(kind));
  to.u32(wire::VERSION);
  to.u32(client);
  const size_t length = exchange(made, to.length());
  wire::reader from(std::span(made.packet).first(length));
  *answer = wire::read_answer(from);
  made.number = answer->second;
  return from.ok();
}

TEEC_Result not_reached(const std::string& path) {
  const int reason = errno;
  if (reason == EACCES || reason == EPERM) {
    return complain(TEEC_ERROR_ACCESS_DENIED, path + ": only the device's owner may use it");
  }
  return complain(TEEC_ERROR_COMMUNICATION,
                  "cannot reach the service of device " + path + ": " + strerror(reason));
}

}  // namespace

void connection::wipe(size_t used) {
  explicit_bzero(packet.data(), used);
}

size_t exchange(connection& over, size_t length, int descriptor) {
  const auto request = std::span(over.packet).first(length);
  const bool sent = wire::send(over.socket.get(), request, descriptor);
  over.wipe(length);
  return sent ? wire::receive(over.socket.get(), over.packet) : 0;
}

link::link(file_descriptor place, std::unique_ptr<connection> first, uint32_t client)
    : process_(getpid()), place_(std::move(place)), client_(client) {
  idle_.push_back(std::move(first));
}

TEEC_Result link::open(const std::string& path, std::shared_ptr<link>* opened) {
  file_descriptor place(os::open_place(path.c_str()));
  if (!place && (errno == ENOENT || errno == ENOTDIR)) {
    return complain(TEEC_ERROR_ITEM_NOT_FOUND, "there is no device at " + path);
  }
  if (!place) return not_reached(path);
  file_descriptor socket = wire::connect_in(place.get(), wire::SOCKET_NAME);
  if (!socket && (errno == ENOENT || errno == ECONNREFUSED)) {
    if (TEEC_Result res = start_service(path)) return res;
    socket = wire::connect_in(place.get(), wire::SOCKET_NAME);
  }
  if (!socket) return not_reached(path);
  if (!is_trusted(socket.get(), place.get())) {
    return complain(TEEC_ERROR_ACCESS_DENIED, path + " is served by a stranger");
  }
  auto first = std::make_unique<connection>(std::move(socket));
  wire::answer answer;
  if (!greet(*first, wire::request::HELLO, 0, &answer)) {
    return complain(TEEC_ERROR_COMMUNICATION, "the service of device " + path + " went away");
  }
  if (answer.result != TEEC_SUCCESS) {
    return complain(answer.result, "the service of device " + path + " refuses this program");
  }
  *opened = std::make_shared<link>(std::move(place), std::move(first), answer.number);
  return TEEC_SUCCESS;
}

bool link::at_home() const {
  return getpid() == process_;
}

bool link::usable() const {
  std::lock_guard lock(mutex_);
  return !ended_ && at_home();
}

std::unique_ptr<connection> link::attach() const {
  file_descriptor socket = wire::connect_in(place_.get(), wire::SOCKET_NAME);
  if (!socket || !is_trusted(socket.get(), place_.get())) return nullptr;
  auto made = std::make_unique<connection>(std::move(socket));
  wire::answer answer;
  const bool greeted = greet(*made, wire::request::ATTACH, client_, &answer);
  return greeted && answer.result == TEEC_SUCCESS ? std::move(made) : nullptr;
}

std::unique_ptr<connection> link::take() {
  if (!at_home()) return nullptr;
  {
    std::lock_guard lock(mutex_);
    if (ended_) return nullptr;
    if (!idle_.empty()) {
      auto one = std::move(idle_.back());
      idle_.pop_back();
      return one;
    }
  }
  return attach();
}

void link::give_back(std::unique_ptr<connection> used, bool failed) {
  std::lock_guard lock(mutex_);
  if (failed) ended_ = true;
  if (!ended_) idle_.push_back(std::move(used));
}

bool link::ask(const std::function<void(wire::writer&)>& write, wire::answer* answer,
               int descriptor) {
  auto over = take();
  if (!over) return false;
  wire::writer to(over->packet);
  write(to);
  const size_t length = exchange(*over, to.length(), descriptor);
  wire::reader from(std::span(over->packet).first(length));
  *answer = wire::read_answer(from);
  const bool ok = from.ok();
  give_back(std::move(over), !ok);
  return ok;
}

void link::cancel(uint32_t connection, uint32_t call) {
  auto over = take();
  if (!over) return;
  wire::writer to(over->packet);
  to.u32(static_cast<uint32_t>(wire::request::CANCEL));
  to.u32(connection);
  to.u32(call);
  const bool sent = wire::send(over->socket.get(), std::span(over->packet).first(to.length()));
  give_back(std::move(over), !sent);
}

}  // namespace tee::remote
