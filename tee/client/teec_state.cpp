// What stands behind the `imp` members of the client API's structures.
#include "tee/client/teec_state.h"

#include "tee/core/log.h"

namespace tee {

imp_table<client_context>& contexts() {
  static auto& table = *new imp_table<client_context>;
  return table;
}

imp_table<client_session>& client_sessions() {
  static auto& table = *new imp_table<client_session>;
  return table;
}

imp_table<client_memory>& client_memories() {
  static auto& table = *new imp_table<client_memory>;
  return table;
}

namespace {

struct flight_list {
  std::mutex mutex;
  std::multimap<const TEEC_Operation*, cancellation*> calls;
};

flight_list& flights() {
  static auto& list = *new flight_list;
  return list;
}

}  // namespace

operation_in_flight::operation_in_flight(const TEEC_Operation* operation) : operation_(operation) {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights().mutex);
  flights().calls.emplace(operation_, &asked_);
}

operation_in_flight::~operation_in_flight() {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights().mutex);
  auto [call, end] = flights().calls.equal_range(operation_);
  while (call != end && call->second != &asked_)
    ++call;
  flights().calls.erase(call);
}

void operation_in_flight::cancel(const TEEC_Operation* operation) {
  std::lock_guard lock(flights().mutex);
  auto [call, end] = flights().calls.equal_range(operation);
  for (; call != end; ++call)
    call->second->request();
}

TEEC_Result trace_failure(const char* what) noexcept {
  log_line(TEE_TRACE_ERROR, "%s", what);
  return TEEC_ERROR_GENERIC;
}

}  // namespace tee
