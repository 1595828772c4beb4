// What stands behind the `imp` members of the client API's structures.
#include "tee/client/teec_state.h"

#include "tee/core/log.h"

namespace tee {

imp_table<client_context, way::IN_PROCESS>& contexts() {
  static auto& table = *new imp_table<client_context, way::IN_PROCESS>;
  return table;
}

imp_table<client_session, way::IN_PROCESS>& client_sessions() {
  static auto& table = *new imp_table<client_session, way::IN_PROCESS>;
  return table;
}

imp_table<client_memory, way::IN_PROCESS>& client_memories() {
  static auto& table = *new imp_table<client_memory, way::IN_PROCESS>;
  return table;
}

TEEC_Result trace_failure(const char* what) noexcept {
  log_line(TEE_TRACE_ERROR, "%s", what);
  return TEEC_ERROR_GENERIC;
}

}  // namespace tee
