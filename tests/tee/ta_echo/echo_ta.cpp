// A trusted application that shows the tests what reaches it.
#include "tests/tee/ta_echo/echo_ta.h"

#include <cstring>

namespace {

TEE_TASessionHandle kept = nullptr;

TEE_Result mirror(TEE_Param* params) {
  auto [a, b] = params[0].value;
  params[0].value = {b, a};
  params[3].value.a++;
  size_t room = params[2].memref.size;
  params[2].memref.size = params[1].memref.size;
  if (params[1].memref.size > room) return TEE_ERROR_SHORT_BUFFER;
  if (room != 0) memcpy(params[2].memref.buffer, params[1].memref.buffer, params[1].memref.size);
  return TEE_SUCCESS;
}

TEE_Result relay(uint32_t types, TEE_Param* params) {
  if (params[0].memref.size < sizeof(TEE_UUID)) {
    return TEE_GetPropertyAsString(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity",
                                   static_cast<char*>(params[1].memref.buffer),
                                   &params[1].memref.size);
  }
  TEE_UUID next;
  memcpy(&next, params[0].memref.buffer, sizeof(next));
  TEE_Param rest[4] = {params[0], params[1], {}, {}};
  rest[0].memref = {static_cast<uint8_t*>(params[0].memref.buffer) + sizeof(next),
                    params[0].memref.size - sizeof(next)};
  TEE_TASessionHandle session;
  TEE_Result res =
      TEE_OpenTASession(&next, TEE_TIMEOUT_INFINITE, 0, nullptr, &session, &params[2].value.a);
  if (res != TEE_SUCCESS) return res;
  res = TEE_InvokeTACommand(session, TEE_TIMEOUT_INFINITE, echo::RELAY, types, rest,
                            &params[2].value.a);
  TEE_CloseTASession(session);
  params[1].memref.size = rest[1].memref.size;
  return res;
}

TEE_Result keep_session() {
  TEE_UUID own;
  TEE_GetPropertyAsUUID(TEE_PROPSET_CURRENT_TA, "gpd.ta.appID", &own);
  const TEE_UUID& other = own.timeMid == echo::FIRST.timeMid ? echo::SECOND : echo::FIRST;
  return TEE_OpenTASession(&other, TEE_TIMEOUT_INFINITE, 0, nullptr, &kept, nullptr);
}

}  // namespace

extern "C" TA_EXPORT const char TA_Properties[] = "gpd.ta.dataSize=65536\ngpd.ta.version=1.2\n";

TEE_Result TA_CreateEntryPoint() {
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint() {
  TEE_CloseTASession(kept);
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t types, TEE_Param* params, void**) {
  if (TEE_PARAM_TYPE_GET(types, 0) != TEE_PARAM_TYPE_VALUE_INOUT) return TEE_SUCCESS;
  params[0].value.b = types;
  return params[0].value.a;  // the result that the client asked for
}

void TA_CloseSessionEntryPoint(void*) {}

TEE_Result TA_InvokeCommandEntryPoint(void*, uint32_t command, uint32_t types, TEE_Param* params) {
  switch (command) {
    case echo::MIRROR:
      return mirror(params);
    case echo::RELAY:
      return relay(types, params);
    case echo::KEEP_SESSION:
      return keep_session();
    case echo::LEAK:
      return TEE_Malloc(100, 0) != nullptr ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
    default:
      return TEE_ERROR_NOT_SUPPORTED;
  }
}
