// TEE Internal Core API: sessions of one trusted application with another.
#include "tee_internal_api.h"

#include <memory>
#include <utility>

#include "tee/api/ta_parameters.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/panic.h"
#include "tee/core/session.h"

using tee::call_parameters;
using tee::call_result;
using tee::fault_point;
using tee::guarded;
using tee::panic;

namespace {

// Runs a call to another instance with copied parameters: use(call_parameters*) makes it. It is
// asked to end when the time is over or the caller is asked to.
template <typename Use>
TEE_Result call_out(const char* call, uint32_t timeout_ms, uint32_t types, TEE_Param* params,
                    uint32_t* return_origin, Use use) {
  uint32_t ignored = 0;
  uint32_t* origin = return_origin != nullptr ? return_origin : &ignored;
  *origin = TEE_ORIGIN_TEE;
  if (TEE_Result res = fault_point()) return res;
  tee::ta_parameters copies(call, types, params);
  const tee::cancellation asked(timeout_ms, tee::current_instance(call).heard());
  copies.for_callee()->asked = &asked;
  const call_result result = use(copies.for_callee());
  *origin = result.origin;
  if (result.origin == TEE_ORIGIN_TRUSTED_APP) copies.copy_back(params);
  return result.code;
}

call_result open_session(const char* call, const TEE_UUID& destination, call_parameters* own,
                         TEE_TASessionHandle* handle) {
  tee::instance& caller = tee::current_instance(call);
  if (caller.opener() == nullptr) return {TEE_ERROR_ITEM_NOT_FOUND, TEE_ORIGIN_TEE};
  const TEE_Identity client{TEE_LOGIN_TRUSTED_APP, caller.uuid()};
  std::shared_ptr<tee::session> opened;
  call_result result = caller.opener()->open_session(destination, client, own, &opened);
  if (result.code != TEE_SUCCESS) return result;
  *handle = caller.sessions().emplace(std::move(opened));
  if (*handle != TEE_HANDLE_NULL) return result;
  return {TEE_ERROR_OUT_OF_MEMORY, TEE_ORIGIN_TEE};
}

}  // namespace

TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t cancellationRequestTimeout,
                             uint32_t paramTypes, TEE_Param params[4], TEE_TASessionHandle* session,
                             uint32_t* returnOrigin) {
  constexpr const char* CALL = "TEE_OpenTASession";
  return guarded(CALL, [&]() -> TEE_Result {
    if (destination == nullptr) panic(CALL, "destination is null");
    if (session == nullptr) panic(CALL, "session is null");
    *session = TEE_HANDLE_NULL;
    return call_out(
        CALL, cancellationRequestTimeout, paramTypes, params, returnOrigin,
        [&](call_parameters* own) { return open_session(CALL, *destination, own, session); });
  });
}

TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle session, uint32_t cancellationRequestTimeout,
                               uint32_t commandID, uint32_t paramTypes, TEE_Param params[4],
                               uint32_t* returnOrigin) {
  constexpr const char* CALL = "TEE_InvokeTACommand";
  return guarded(CALL, [&]() -> TEE_Result {
    tee::session& target = *tee::current_instance(CALL).sessions().get(session, CALL);
    return call_out(CALL, cancellationRequestTimeout, paramTypes, params, returnOrigin,
                    [&](call_parameters* own) { return target.invoke(commandID, own); });
  });
}

void TEE_CloseTASession(TEE_TASessionHandle session) {
  constexpr const char* CALL = "TEE_CloseTASession";
  guarded(CALL, [&] {
    if (session != TEE_HANDLE_NULL) tee::current_instance(CALL).sessions().remove(session, CALL);
  });
}
