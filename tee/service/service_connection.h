// One connection to the service: what comes over it, and the answers.
#pragma once

#include "tee_client_api.h"

#include <cstdint>
#include <memory>
#include <span>

#include "tee/device/secret_bytes.h"
#include "tee/service/remote_client.h"
#include "tee/service/service.h"
#include "tee/wire/records.h"

namespace tee::service {

// One message at a time, in the connection's own thread. A message is read once, into memory of the
// service; one that is not as the protocol has it is refused.
class service_connection {
 public:
  service_connection(service& owner, file_descriptor socket, uint32_t number);
  service_connection(const service_connection&) = delete;
  service_connection& operator=(const service_connection&) = delete;

  // serve: until the other end is gone; the client has then let go of this connection.
  void serve();

  // From other threads: the other end is gone; to be ended.
  void peer_is_gone() { calls_->cancel_any(); }
  void hang_up();

  service& owner() { return owner_; }
  uint32_t number() const { return number_; }

 private:
  void answer_all();

  // Answers the request; 0: there is no answer. Throws what a call may throw.
  size_t answer_to(std::span<const uint8_t> message);
  size_t greet(wire::reader& from, bool attach);
  size_t share(wire::reader& from);
  size_t end(wire::reader& from, wire::request kind);
  size_t open(wire::reader& from);
  size_t invoke(wire::reader& from);
  size_t write(const wire::answer& answer);
  size_t refuse(TEEC_Result code) { return write({code, TEEC_ORIGIN_COMMS, 0, 0, {}}); }

  // Runs the call in `from`: run(parameters, &number).
  template <typename Run>
  size_t call(wire::reader& from, uint32_t number, Run run);

  service& owner_;
  const file_descriptor socket_;
  const uint32_t number_;
  wire::peer_credentials peer_{};
  std::shared_ptr<remote_client> client_;  // after a greeting
  std::shared_ptr<call_in_progress> calls_ = std::make_shared<call_in_progress>();
  file_descriptor came_;  // with the message
  bool stops_ = false;    // the service, after the answer
  secret_bytes request_ = secret_bytes(wire::MESSAGE_MAX);
  secret_bytes answer_ = secret_bytes(wire::MESSAGE_MAX);  // zeros between two messages
  size_t answer_used_ = wire::ANSWER_HEADER;
};

}  // namespace tee::service
