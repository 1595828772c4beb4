// TEE Client API 1.0: contexts and sessions. The TEE runs in the calling process; a context is
// opened on a device folder.
#include "tee_client_api.h"

#include <cstring>
#include <memory>
#include <utility>

#include "tee/client/teec_parameters.h"
#include "tee/client/teec_state.h"
#include "tee/host/client_identity.h"
#include "tee/host/open_device.h"

using tee::call_parameters;
using tee::call_result;
using tee::client_call;
using tee::client_context;
using tee::client_session;

namespace {

TEE_UUID to_tee(const TEEC_UUID& uuid) {
  TEE_UUID same{uuid.timeLow, uuid.timeMid, uuid.timeHiAndVersion, {}};
  std::memcpy(same.clockSeqAndNode, uuid.clockSeqAndNode, sizeof(same.clockSeqAndNode));
  return same;
}

// Runs a call to a trusted application with the operation's parameters, on behalf of a client of
// `context`: call(call_parameters*) makes it. The trusted application's outputs go back whatever
// its result; `return_origin` may be null.
template <typename Call>
TEEC_Result call_in(const void* context, TEEC_Operation* operation, uint32_t* return_origin,
                    Call call) {
  uint32_t origin = TEEC_ORIGIN_API;
  TEEC_Result res = client_call([&]() -> TEEC_Result {
    tee::teec_parameters given;
    TEEC_Result taken = given.take(context, operation);
    if (taken != TEEC_SUCCESS) return taken;
    const tee::operation_in_flight flight(operation);
    given.for_callee()->asked = flight.asked();
    const call_result result = call(given.for_callee());
    origin = result.origin;
    if (origin == TEEC_ORIGIN_TRUSTED_APP && operation != nullptr) given.give_back(operation);
    return result.code;
  });
  if (return_origin != nullptr) *return_origin = origin;
  return res;
}

}  // namespace

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context) {
  return client_call([&]() -> TEEC_Result {
    if (context == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    context->imp = nullptr;
    std::shared_ptr<tee::session_opener> host;
    if (TEE_Result res = tee::open_device(name, &host)) return res;
    auto opened = std::make_shared<client_context>(client_context{std::move(host)});
    context->imp = tee::contexts().add(std::move(opened));
    return TEEC_SUCCESS;
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
  return call_in(context->imp, operation, returnOrigin, [&](call_parameters* own) -> call_result {
    TEE_Identity identity{};
    TEE_Result res = tee::identify_client(connectionMethod, connectionData, &identity);
    if (res != TEE_SUCCESS) return {res, TEE_ORIGIN_API};
    auto opened = std::make_shared<client_session>(client_session{context->imp, client->host, {}});
    const call_result result =
        client->host->open_session(to_tee(*destination), identity, own, &opened->session);
    if (result.code == TEE_SUCCESS) session->imp = tee::client_sessions().add(std::move(opened));
    return result;
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
                 [&](call_parameters* own) { return client->session->invoke(commandID, own); });
}

void TEEC_RequestCancellation(TEEC_Operation* operation) {
  client_call([&]() -> TEEC_Result {
    tee::operation_in_flight::cancel(operation);
    return TEEC_SUCCESS;
  });
}
