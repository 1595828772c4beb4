// TEE Client API 1.0: contexts and sessions. The TEE runs in the calling process; a context is
// opened on a device folder. Cancellation has no effect: commands run to their end.
#include "tee_client_api.h"

#include <cerrno>
#include <cstring>
#include <memory>
#include <utility>

#include "tee/device/files.h"
#include "tee/runtime/client_identity.h"
#include "tee/runtime/log.h"
#include "tee/runtime/teec_parameters.h"
#include "tee/runtime/teec_state.h"

using tee::client_call;
using tee::client_context;
using tee::client_session;
using tee::device_error;

namespace {

TEEC_Result result_of(const device_error& error) {
  switch (error.reason()) {
    case device_error::kind::NOT_FOUND:
      return TEEC_ERROR_ITEM_NOT_FOUND;
    case device_error::kind::BUSY:
      return TEEC_ERROR_BUSY;
    case device_error::kind::DAMAGED:
      return TEEC_ERROR_BAD_FORMAT;
    case device_error::kind::EXISTS:
    case device_error::kind::IO:
      break;
  }
  const auto* refused = dynamic_cast<const tee::file_error*>(&error);
  bool denied =
      refused != nullptr && (refused->error_number() == EACCES || refused->error_number() == EPERM);
  return denied ? TEEC_ERROR_ACCESS_DENIED : TEEC_ERROR_GENERIC;
}

TEE_UUID to_tee(const TEEC_UUID& uuid) {
  TEE_UUID same{uuid.timeLow, uuid.timeMid, uuid.timeHiAndVersion, {}};
  std::memcpy(same.clockSeqAndNode, uuid.clockSeqAndNode, sizeof(same.clockSeqAndNode));
  return same;
}

// Runs a call to a trusted application with the operation's parameters, on behalf of a client of
// `context`: call(parameters, uint32_t* origin) makes it. The trusted application's outputs go back
// whatever its result; `return_origin` may be null.
template <typename Call>
TEEC_Result call_in(const void* context, TEEC_Operation* operation, uint32_t* return_origin,
                    Call call) {
  uint32_t origin = TEEC_ORIGIN_API;
  TEEC_Result res = client_call([&]() -> TEEC_Result {
    tee::teec_parameters given;
    TEEC_Result taken = given.take(context, operation);
    if (taken != TEEC_SUCCESS) return taken;
    TEEC_Result result = call(given, &origin);
    if (origin == TEEC_ORIGIN_TRUSTED_APP && operation != nullptr) given.give_back(operation);
    return result;
  });
  if (return_origin != nullptr) *return_origin = origin;
  return res;
}

}  // namespace

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context) {
  return client_call([&]() -> TEEC_Result {
    if (context == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    context->imp = nullptr;
    try {
      std::string path = name != nullptr ? name : tee::device::default_path();
      auto opened = std::make_shared<client_context>(client_context{tee::ta_host::open(path)});
      context->imp = tee::contexts().add(std::move(opened));
      return TEEC_SUCCESS;
    } catch (const device_error& error) {
      tee::log_line(TEE_TRACE_ERROR, "%s", error.what());
      return result_of(error);
    }
  });
}

void TEEC_FinalizeContext(TEEC_Context* context) {
  if (context == nullptr) return;
  client_call([&]() -> TEEC_Result {
    auto ended = tee::contexts().take(context->imp);
    // A client should have ended these; they go before the last hold on the host does.
    tee::client_sessions().take_all_of(context->imp);
    tee::client_memories().take_all_of(context->imp);
    context->imp = nullptr;
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_OpenSession(TEEC_Context* context, TEEC_Session* session,
                             const TEEC_UUID* destination, uint32_t connectionMethod,
                             const void* connectionData, TEEC_Operation* operation,
                             uint32_t* returnOrigin) {
  if (returnOrigin != nullptr) *returnOrigin = TEEC_ORIGIN_API;
  if (session != nullptr) session->imp = nullptr;
  if (context == nullptr || session == nullptr || destination == nullptr) {
    return TEEC_ERROR_BAD_PARAMETERS;
  }
  auto client = tee::contexts().find(context->imp);
  if (!client) return TEEC_ERROR_BAD_PARAMETERS;
  return call_in(
      context->imp, operation, returnOrigin,
      [&](tee::teec_parameters& parameters, uint32_t* origin) -> TEEC_Result {
        TEE_Identity identity{};
        TEE_Result res = tee::identify_client(connectionMethod, connectionData, &identity);
        if (res != TEE_SUCCESS) return res;
        auto opened =
            std::make_shared<client_session>(client_session{context->imp, client->host, {}});
        res =
            tee::ta_session::open(*client->host, to_tee(*destination), identity, parameters.types(),
                                  parameters.params(), &opened->session, origin);
        if (res == TEE_SUCCESS) session->imp = tee::client_sessions().add(std::move(opened));
        return res;
      });
}

void TEEC_CloseSession(TEEC_Session* session) {
  if (session == nullptr) return;
  client_call([&]() -> TEEC_Result {
    tee::client_sessions().take(session->imp);
    session->imp = nullptr;
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_InvokeCommand(TEEC_Session* session, uint32_t commandID, TEEC_Operation* operation,
                               uint32_t* returnOrigin) {
  if (returnOrigin != nullptr) *returnOrigin = TEEC_ORIGIN_API;
  if (session == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  auto client = tee::client_sessions().find(session->imp);
  if (!client) return TEEC_ERROR_BAD_PARAMETERS;
  return call_in(client->context, operation, returnOrigin,
                 [&](tee::teec_parameters& parameters, uint32_t* origin) {
                   return client->session->invoke(commandID, parameters.types(),
                                                  parameters.params(), origin);
                 });
}

void TEEC_RequestCancellation(TEEC_Operation* /*operation*/) {}
