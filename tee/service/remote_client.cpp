// A client of the service.
#include "tee/service/remote_client.h"

#include <sys/socket.h>
#include <utility>

namespace tee::service {

namespace {

std::vector<gid_t> groups_of(int socket, gid_t effective) {
  std::vector<gid_t> groups;
  socklen_t length = 0;
  // The first call tells the length that it takes.
  if (getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, nullptr, &length) != 0 && length != 0) {
    groups.resize(length / sizeof(gid_t));
    if (getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length) != 0) groups.clear();
  }
  groups.push_back(effective);
  return groups;
}

}  // namespace

void call_in_progress::begin(uint32_t number, cancellation* asked) {
  std::lock_guard lock(mutex_);
  asked_ = asked;
  number_ = number;
  if (cancelled_ == number) asked->request();
}

void call_in_progress::end() {
  std::lock_guard lock(mutex_);
  asked_ = nullptr;
}

void call_in_progress::cancel(uint32_t number) {
  std::lock_guard lock(mutex_);
  cancelled_ = number;
  if (asked_ != nullptr && number_ == number) asked_->request();
}

void call_in_progress::cancel_any() {
  std::lock_guard lock(mutex_);
  if (asked_ != nullptr) asked_->request();
}

remote_client::remote_client(session_opener& host, const wire::peer_credentials& peer, int socket)
    : host_(host),
      peer_(peer),
      process_{peer.user, groups_of(socket, peer.group),
               "/proc/" + std::to_string(peer.process) + "/exe"} {}

bool remote_client::is_of(const wire::peer_credentials& peer) const {
  return peer.process == peer_.process && peer.user == peer_.user;
}

call_result remote_client::open(const TEE_UUID& destination, uint32_t method, const void* data,
                                call_parameters* parameters, uint32_t* number) {
  TEE_Identity identity{};
  if (TEE_Result res = identify_client(process_, method, data, &identity)) {
    return {res, TEE_ORIGIN_API};
  }
  {
    std::lock_guard lock(mutex_);
    if (sessions_.size() >= SESSIONS_MAX) return {TEE_ERROR_OUT_OF_MEMORY, TEE_ORIGIN_TEE};
  }
  std::shared_ptr<session> opened;
  const call_result result = host_.open_session(destination, identity, parameters, &opened);
  if (result.code == TEE_SUCCESS) {
    std::lock_guard lock(mutex_);
    *number = ++last_session_;
    sessions_.insert_or_assign(*number, std::move(opened));
  }
  return result;
}

std::shared_ptr<session> remote_client::find(uint32_t number) {
  std::lock_guard lock(mutex_);
  auto found = sessions_.find(number);
  return found == sessions_.end() ? nullptr : found->second;
}

call_result remote_client::invoke(uint32_t number, uint32_t command, call_parameters* parameters) {
  const std::shared_ptr<session> with = find(number);
  if (!with) return {TEE_ERROR_BAD_PARAMETERS, TEE_ORIGIN_API};
  return with->invoke(command, parameters);
}

void remote_client::close(uint32_t number) {
  std::unique_lock lock(mutex_);
  auto ended = sessions_.extract(number);
  lock.unlock();
  if (!ended.empty()) ended.mapped()->close();
}

bool remote_client::attach(uint32_t connection, std::shared_ptr<call_in_progress> calls) {
  std::lock_guard lock(mutex_);
  if (connections_.size() >= CONNECTIONS_MAX) return false;
  connections_.insert_or_assign(connection, std::move(calls));
  return true;
}

void remote_client::detach(uint32_t connection) {
  std::lock_guard lock(mutex_);
  connections_.erase(connection);
}

void remote_client::cancel(uint32_t connection, uint32_t call) {
  std::unique_lock lock(mutex_);
  auto found = connections_.find(connection);
  if (found == connections_.end()) return;
  const std::shared_ptr<call_in_progress> calls = found->second;
  lock.unlock();
  calls->cancel(call);
}

}  // namespace tee::service
