// TEE Internal Core API: sessions of one trusted application with another.
#include "tee_internal_api.h"

#include <new>
#include <utility>

#include "tee/device/uuid.h"
#include "tee/runtime/faults.h"
#include "tee/runtime/instance.h"
#include "tee/runtime/log.h"
#include "tee/runtime/panic.h"
#include "tee/runtime/ta_parameters.h"
#include "tee/runtime/ta_session.h"

using tee::fault_point;
using tee::guarded;
using tee::panic;
using tee::ta_parameters;
using tee::ta_session;

namespace {

// Runs a call to another instance with copied parameters:
// use(TEE_Param*, uint32_t* origin) makes it.
template <typename Use>
TEE_Result call_out(const char* call, uint32_t types, TEE_Param* params, uint32_t* return_origin,
                    Use use) {
  uint32_t ignored = 0;
  uint32_t* origin = return_origin != nullptr ? return_origin : &ignored;
  *origin = TEE_ORIGIN_TEE;
  if (TEE_Result res = fault_point()) return res;
  ta_parameters copies(call, types, params);
  TEE_Result res = use(copies.for_callee(), origin);
  if (*origin == TEE_ORIGIN_TRUSTED_APP) copies.copy_back(params);
  return res;
}

TEE_Result open_session(const char* call, const TEE_UUID& destination, uint32_t types,
                        TEE_Param* params, TEE_TASessionHandle* handle, uint32_t* origin) {
  tee::instance& caller = tee::current_instance(call);
  tee::ta_host* host = tee::ta_host::serving(caller.dev());
  if (host == nullptr) return TEE_ERROR_ITEM_NOT_FOUND;
  const TEE_Identity client{TEE_LOGIN_TRUSTED_APP, caller.uuid()};
  std::shared_ptr<ta_session> session;
  TEE_Result res = ta_session::open(*host, destination, client, types, params, &session, origin);
  if (res != TEE_SUCCESS) return res;
  *handle = caller.sessions().emplace(std::move(session));
  if (*handle != TEE_HANDLE_NULL) return TEE_SUCCESS;
  *origin = TEE_ORIGIN_TEE;
  return TEE_ERROR_OUT_OF_MEMORY;
}

}  // namespace

TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t /*cancellationRequestTimeout*/,
                             uint32_t paramTypes, TEE_Param params[4], TEE_TASessionHandle* session,
                             uint32_t* returnOrigin) {
  constexpr const char* CALL = "TEE_OpenTASession";
  return guarded(CALL, [&]() -> TEE_Result {
    if (destination == nullptr) panic(CALL, "destination is null");
    if (session == nullptr) panic(CALL, "session is null");
    *session = TEE_HANDLE_NULL;
    return call_out(CALL, paramTypes, params, returnOrigin, [&](TEE_Param* own, uint32_t* origin) {
      return open_session(CALL, *destination, paramTypes, own, session, origin);
    });
  });
}

TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle session, uint32_t /*cancellationRequestTimeout*/,
                               uint32_t commandID, uint32_t paramTypes, TEE_Param params[4],
                               uint32_t* returnOrigin) {
  constexpr const char* CALL = "TEE_InvokeTACommand";
  return guarded(CALL, [&]() -> TEE_Result {
    ta_session& target = *tee::current_instance(CALL).sessions().get(session, CALL);
    return call_out(CALL, paramTypes, params, returnOrigin, [&](TEE_Param* own, uint32_t* origin) {
      return target.invoke(commandID, paramTypes, own, origin);
    });
  });
}

void TEE_CloseTASession(TEE_TASessionHandle session) {
  constexpr const char* CALL = "TEE_CloseTASession";
  guarded(CALL, [&] {
    if (session != TEE_HANDLE_NULL) tee::current_instance(CALL).sessions().remove(session, CALL);
  });
}
