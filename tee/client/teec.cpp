// TEE Client API 1.0: contexts and sessions of a TEE in the calling process; a context is opened on
// a device folder.
#include <cstring>
#include <memory>
#include <utility>

#include "tee/client/in_process.h"
#include "tee/client/teec_state.h"
#include "tee/host/client_identity.h"
#include "tee/host/open_device.h"

namespace tee::in_process {
namespace {

TEE_UUID to_tee(const TEEC_UUID& uuid) {
  TEE_UUID same{uuid.timeLow, uuid.timeMid, uuid.timeHiAndVersion, {}};
  std::memcpy(same.clockSeqAndNode, uuid.clockSeqAndNode, sizeof(same.clockSeqAndNode));
  return same;
}

std::shared_ptr<const shared_region> find_memory(const void* imp) {
  return client_memories().find(imp);
}

// Runs a call to a trusted application with the operation's parameters, on behalf of a client of
// `context`: call(call_parameters*) makes it. The trusted application's outputs go back whatever
// its result; `return_origin` may be null.
template <typename Call>
TEEC_Result call_in(const void* context, TEEC_Operation* operation, uint32_t* return_origin,
                    Call call) {
  uint32_t origin = TEEC_ORIGIN_API;
  TEEC_Result res = client_call([&]() -> TEEC_Result {
    operation_parameters given;
    TEEC_Result taken = given.take(context, operation, find_memory);
    if (taken != TEEC_SUCCESS) return taken;
    cancellation asked;
    const operation_in_flight flight(operation, [&asked] { asked.request(); });
    call_parameters own{given.types(), given.slots(), operation != nullptr ? &asked : nullptr};
    const call_result result = call(&own);
    origin = result.origin;
    if (origin == TEEC_ORIGIN_TRUSTED_APP && operation != nullptr) {
      given.give_back(own.slots, operation);
    }
    return result.code;
  });
  if (return_origin != nullptr) *return_origin = origin;
  return res;
}

}  // namespace

TEEC_Result initialize_context(const char* name, TEEC_Context* context) {
  return client_call([&]() -> TEEC_Result {
    if (context == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    context->imp = nullptr;
    std::shared_ptr<session_opener> host;
    if (TEE_Result res = open_device(name, &host)) return res;
    auto opened = std::make_shared<client_context>(client_context{std::move(host)});
    context->imp = contexts().add(std::move(opened));
    return TEEC_SUCCESS;
  });
}

void finalize_context(TEEC_Context* context) {
  if (context == nullptr) return;
  client_call([&]() -> TEEC_Result {
    auto ended = contexts().take(context->imp);
    // A client should have ended these; they go before the last hold on the host does.
    client_sessions().take_all_of(context->imp);
    client_memories().take_all_of(context->imp);
    context->imp = nullptr;
    return TEEC_SUCCESS;
  });
}

TEEC_Result open_session(TEEC_Context* context, TEEC_Session* session, const TEEC_UUID* destination,
                         uint32_t connection_method, const void* connection_data,
                         TEEC_Operation* operation, uint32_t* return_origin) {
  if (return_origin != nullptr) *return_origin = TEEC_ORIGIN_API;
  if (session != nullptr) session->imp = nullptr;
  if (context == nullptr || session == nullptr || destination == nullptr) {
    return TEEC_ERROR_BAD_PARAMETERS;
  }
  auto client = contexts().find(context->imp);
  if (!client) return TEEC_ERROR_BAD_PARAMETERS;
  return call_in(context->imp, operation, return_origin, [&](call_parameters* own) -> call_result {
    TEE_Identity identity{};
    TEE_Result res = identify_client(own_process(), connection_method, connection_data, &identity);
    if (res != TEE_SUCCESS) return {res, TEE_ORIGIN_API};
    auto opened = std::make_shared<client_session>(client_session{context->imp, client->host, {}});
    const call_result result =
        client->host->open_session(to_tee(*destination), identity, own, &opened->session);
    if (result.code == TEE_SUCCESS) session->imp = client_sessions().add(std::move(opened));
    return result;
  });
}

void close_session(TEEC_Session* session) {
  if (session == nullptr) return;
  client_call([&]() -> TEEC_Result {
    client_sessions().take(session->imp);
    session->imp = nullptr;
    return TEEC_SUCCESS;
  });
}

TEEC_Result invoke_command(TEEC_Session* session, uint32_t command, TEEC_Operation* operation,
                           uint32_t* return_origin) {
  if (return_origin != nullptr) *return_origin = TEEC_ORIGIN_API;
  if (session == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  auto client = client_sessions().find(session->imp);
  if (!client) return TEEC_ERROR_BAD_PARAMETERS;
  return call_in(client->context, operation, return_origin,
                 [&](call_parameters* own) { return client->session->invoke(command, own); });
}

void request_cancellation(TEEC_Operation* operation) {
  client_call([&]() -> TEEC_Result {
    operation_in_flight::cancel(operation);
    return TEEC_SUCCESS;
  });
}

}  // namespace tee::in_process
