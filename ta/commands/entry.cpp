// The entry points of the Keymaster TA. All state is the instance's: sessions carry none, and what
// one session began another may go on with.
#include "tee_internal_api.h"

#include "ta/auth/auth_state.h"
#include "ta/auth/operation_pool.h"
#include "ta/base/outcome.h"
#include "ta/commands/configured.h"
#include "ta/commands/dispatch.h"
#include "ta/soter/finger_id.h"
#include "ta/soter/provisioning.h"
#include "ta/store/key_store.h"

using keymaster::dispatch;

TEE_Result TA_CreateEntryPoint() {
  keymaster::trace_scope::reset();
  const keymaster::trace_scope scope;
  keymaster::configured_init();
  keymaster::finger_id_init();
  if (TEE_Result res = keymaster::key_store_init()) {
    return keymaster::fail(res, "Init key store failed");
  }
  keymaster::operation_pool_init();
  if (TEE_Result res = keymaster::authorizaiton_init()) {
    return keymaster::fail(res, "Init authorization failed");
  }
  return TEE_SUCCESS;
}

// Live operations are not walked: the TEE takes back what an instance leaves.
void TA_DestroyEntryPoint() {
  keymaster::authorization_destroy();
  keymaster::soter_deinit();
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t, TEE_Param*, void**) {
  return TEE_SUCCESS;
}

void TA_CloseSessionEntryPoint(void*) {}

TEE_Result TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                      TEE_Param* params) {
  const keymaster::trace_scope scope;
  keymaster::trace(
      TEE_TRACE_INFO,
      "TA_InvokeCommandEntryPoint nCommandID 0x%x pSessionContext %p nParamTypes 0x%x\n", commandID,
      sessionContext, paramTypes);
  return dispatch(commandID, paramTypes, params);
}
