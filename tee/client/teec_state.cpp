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

TEEC_Result trace_failure(const char* what) noexcept {
  log_line(TEE_TRACE_ERROR, "%s", what);
  return TEEC_ERROR_GENERIC;
}

}  // namespace tee
