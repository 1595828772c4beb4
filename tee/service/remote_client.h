// A client of the service: a context in another process, on one connection or several.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "tee/core/session.h"
#include "tee/host/client_identity.h"
#include "tee/service/shared_memories.h"
#include "tee/wire/socket.h"

namespace tee::service {

// A call on a connection, which others may want to end.
class call_in_progress {
 public:
  // begin: the call of that number, which `asked` ends; asked at once when that was requested
  // before the call came. end: it ended.
  void begin(uint32_t number, cancellation* asked);
  void end();

  // cancel: that call, now or when it comes. cancel_any: whichever there is.
  void cancel(uint32_t number);
  void cancel_any();

 private:
  std::mutex mutex_;
  cancellation* asked_ = nullptr;
  uint32_t number_ = 0;
  uint32_t cancelled_ = 0;  // the last one that was to be
};

// Its sessions and memory end with it. Safe to use from any thread.
class remote_client {
 public:
  static constexpr size_t SESSIONS_MAX = 256;
  static constexpr size_t CONNECTIONS_MAX = 128;

  remote_client(session_opener& host, const wire::peer_credentials& peer, int socket);
  remote_client(const remote_client&) = delete;
  remote_client& operator=(const remote_client&) = delete;

  // is_of: whether a connection with that peer can be this client's.
  bool is_of(const wire::peer_credentials& peer) const;

  call_result open(const TEE_UUID& destination, uint32_t method, const void* data,
                   call_parameters* parameters, uint32_t* number);
  call_result invoke(uint32_t number, uint32_t command, call_parameters* parameters);
  void close(uint32_t number);

  shared_memories& memories() { return memories_; }

  // attach: notes a connection's calls, to be cancelled through any other; false when there are too
  // many. cancel: a call on one.
  [[nodiscard]] bool attach(uint32_t connection, std::shared_ptr<call_in_progress> calls);
  void detach(uint32_t connection);
  void cancel(uint32_t connection, uint32_t call);

 private:
  std::shared_ptr<session> find(uint32_t number);

  session_opener& host_;
  const wire::peer_credentials peer_;
  const client_process process_;
  shared_memories memories_;
  std::mutex mutex_;
  std::map<uint32_t, std::shared_ptr<session>> sessions_;
  uint32_t last_session_ = 0;
  std::map<uint32_t, std::shared_ptr<call_in_progress>> connections_;
};

}  // namespace tee::service
