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

// Calls in flight are few: a list of them, chained through themselves, takes no memory.
std::mutex flights_mutex;
operation_in_flight* last_flight = nullptr;

}  // namespace

operation_in_flight::operation_in_flight(const TEEC_Operation* operation) : operation_(operation) {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights_mutex);
  before_ = last_flight;
  if (before_ != nullptr) before_->after_ = this;
  last_flight = this;
}

operation_in_flight::~operation_in_flight() {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights_mutex);
  if (before_ != nullptr) before_->after_ = after_;
  (after_ != nullptr ? after_->before_ : last_flight) = before_;
}

void operation_in_flight::cancel(const TEEC_Operation* operation) {
  std::lock_guard lock(flights_mutex);
  for (operation_in_flight* call = last_flight; call != nullptr; call = call->before_) {
    if (call->operation_ == operation) call->asked_.request();
  }
}

TEEC_Result trace_failure(const char* what) noexcept {
  log_line(TEE_TRACE_ERROR, "%s", what);
  return TEEC_ERROR_GENERIC;
}

}  // namespace tee
