// One connection to the service.
#include "tee/service/service_connection.h"

#include <cstring>
#include <new>
#include <openssl/crypto.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

#include "tee/core/log.h"
#include "tee/service/call_memory.h"

namespace tee::service {

service_connection::service_connection(service& owner, file_descriptor socket, uint32_t number)
    : owner_(owner), socket_(std::move(socket)), number_(number) {}

void service_connection::hang_up() {
  shutdown(socket_.get(), SHUT_RDWR);
  calls_->cancel_any();
}

void service_connection::serve() {
  if (wire::read_peer(socket_.get(), &peer_)) answer_all();
  if (!client_) return;
  client_->detach(number_);
  client_ = nullptr;  // its sessions end with its last connection
}

void service_connection::answer_all() {
  for (;;) {
    const size_t got = wire::receive(socket_.get(), request_, &came_);
    if (got == 0) return;
    size_t length = 0;
    try {
      length = answer_to(std::span(request_).first(got));
    } catch (const std::bad_alloc&) {
      length = refuse(TEEC_ERROR_OUT_OF_MEMORY);
    } catch (const std::exception& error) {
      log_line(TEE_TRACE_ERROR, "%s", error.what());
      length = refuse(TEEC_ERROR_GENERIC);
    }
    came_ = {};
    OPENSSL_cleanse(request_.data(), got);
    if (length == 0) continue;
    const bool sent = wire::send(socket_.get(), std::span(answer_).first(length));
    OPENSSL_cleanse(answer_.data(), answer_used_);
    if (stops_) owner_.stop();  // whoever asked for it has the answer
    if (!sent) return;
  }
}

size_t service_connection::write(const wire::answer& answer) {
  wire::writer to(answer_);
  wire::write(to, answer);
  return to.length();
}

size_t service_connection::answer_to(std::span<const uint8_t> message) {
  wire::reader from(message);
  const auto kind = static_cast<wire::request>(from.u32());
  if (!owner_.may_connect(peer_)) return refuse(TEEC_ERROR_ACCESS_DENIED);
  switch (kind) {
    case wire::request::HELLO:
    case wire::request::ATTACH:
      return greet(from, kind == wire::request::ATTACH);
    case wire::request::STATUS:
      return write({TEEC_SUCCESS,
                    TEEC_ORIGIN_COMMS,
                    static_cast<uint32_t>(getpid()),
                    static_cast<uint32_t>(owner_.since()),
                    {}});
    case wire::request::STOP:
      stops_ = true;
      return write({TEEC_SUCCESS, TEEC_ORIGIN_COMMS, 0, 0, {}});
    default:
      break;
  }
  if (!client_) return refuse(TEEC_ERROR_BAD_STATE);
  switch (kind) {
    case wire::request::SHARE:
      return share(from);
    case wire::request::RELEASE:
    case wire::request::CLOSE:
      return end(from, kind);
    case wire::request::OPEN:
      return open(from);
    case wire::request::INVOKE:
      return invoke(from);
    case wire::request::CANCEL: {
      const uint32_t connection = from.u32();
      client_->cancel(connection, from.u32());
      return 0;
    }
    default:
      return refuse(TEEC_ERROR_NOT_IMPLEMENTED);
  }
}

size_t service_connection::greet(wire::reader& from, bool attach) {
  const uint32_t version = from.u32();
  uint32_t number = from.u32();
  if (!from.ended() || version != wire::VERSION) return refuse(TEEC_ERROR_NOT_SUPPORTED);
  if (client_) return refuse(TEEC_ERROR_BAD_STATE);
  std::shared_ptr<remote_client> found;
  if (attach) {
    found = owner_.find_client(number);
    if (!found || !found->is_of(peer_)) return refuse(TEEC_ERROR_ACCESS_DENIED);
  } else {
    found = std::make_shared<remote_client>(owner_.host(), peer_, socket_.get());
    number = owner_.add_client(found);
  }
  if (!found->attach(number_, calls_)) return refuse(TEEC_ERROR_BUSY);
  client_ = std::move(found);
  return write({TEEC_SUCCESS, TEEC_ORIGIN_COMMS, number, number_, {}});
}

// The new memory takes the place of another of the client's, which may be none.
size_t service_connection::share(wire::reader& from) {
  const uint32_t size = from.u32();
  const uint32_t replaced = from.u32();
  if (!from.ended() || !came_) return refuse(TEEC_ERROR_BAD_PARAMETERS);
  client_->memories().remove(replaced);
  const uint32_t number = client_->memories().add(std::move(came_), size);
  if (number == 0) return refuse(TEEC_ERROR_OUT_OF_MEMORY);
  return write({TEEC_SUCCESS, TEEC_ORIGIN_COMMS, number, 0, {}});
}

template <typename Run>
size_t service_connection::call(wire::reader& from, uint32_t number, Run run) {
  call_memory memory;
  const bool taken = memory.take(from, client_->memories(), answer_);
  answer_used_ = memory.used();
  if (!taken) return refuse(TEEC_ERROR_BAD_PARAMETERS);
  cancellation asked;
  memory.parameters().asked = &asked;
  calls_->begin(number, &asked);
  uint32_t made = 0;
  call_result result;
  try {
    result = run(&memory.parameters(), &made);
  } catch (...) {
    calls_->end();
    throw;
  }
  calls_->end();
  return memory.write_back({result.code, result.origin, made, 0, {}});
}

size_t service_connection::end(wire::reader& from, wire::request kind) {
  const uint32_t number = from.u32();
  if (!from.ended()) return refuse(TEEC_ERROR_BAD_PARAMETERS);
  if (kind == wire::request::CLOSE) {
    client_->close(number);
  } else {
    client_->memories().remove(number);
  }
  return write({});
}

size_t service_connection::open(wire::reader& from) {
  const uint32_t number = from.u32();
  TEE_UUID uuid{};
  uuid.timeLow = from.u32();
  const uint32_t middle = from.u32();
  uuid.timeMid = static_cast<uint16_t>(middle);
  uuid.timeHiAndVersion = static_cast<uint16_t>(middle >> 16);
  const auto node = from.bytes(sizeof(uuid.clockSeqAndNode));
  std::copy(node.begin(), node.end(), uuid.clockSeqAndNode);
  const uint32_t method = from.u32();
  const bool has_group = from.u32() != 0;
  const uint32_t group = from.u32();
  return call(from, number, [&](call_parameters* parameters, uint32_t* made) {
    return client_->open(uuid, method, has_group ? &group : nullptr, parameters, made);
  });
}

size_t service_connection::invoke(wire::reader& from) {
  const uint32_t number = from.u32();
  const uint32_t session = from.u32();
  const uint32_t command = from.u32();
  return call(from, number, [&](call_parameters* parameters, uint32_t* /*made*/) {
    return client_->invoke(session, command, parameters);
  });
}

}  // namespace tee::service
