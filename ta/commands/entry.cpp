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

namespace keymaster {

// The loader looks for these names. They are given here, so that nothing depends on the linkage
// that the platform's header declares its entry points with.
#define ENTRY_POINT(name) __asm__(#name) __attribute__((visibility("default"), used))
TEE_Result TA_CreateEntryPoint() ENTRY_POINT(TA_CreateEntryPoint);
void TA_DestroyEntryPoint() ENTRY_POINT(TA_DestroyEntryPoint);
TEE_Result TA_OpenSessionEntryPoint(uint32_t, TEE_Param*, void**)
    ENTRY_POINT(TA_OpenSessionEntryPoint);
void TA_CloseSessionEntryPoint(void*) ENTRY_POINT(TA_CloseSessionEntryPoint);
TEE_Result TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                      TEE_Param* params) ENTRY_POINT(TA_InvokeCommandEntryPoint);

TEE_Result TA_CreateEntryPoint() {
  trace_scope::reset();
  const trace_scope scope;
  configured_init();
  finger_id_init();
  soter_forget();
  if (TEE_Result res = key_store_init()) {
    return fail(res, "Init key store failed");
  }
  operation_pool_init();
  if (TEE_Result res = authorizaiton_init()) {
    return fail(res, "Init authorization failed");
  }
  return TEE_SUCCESS;
}

// Live operations are not walked: the TEE takes back what an instance leaves.
void TA_DestroyEntryPoint() {
  authorization_destroy();
  soter_deinit();
  key_store_destroy();
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t, TEE_Param*, void**) {
  return TEE_SUCCESS;
}

void TA_CloseSessionEntryPoint(void*) {}

TEE_Result TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID, uint32_t paramTypes,
                                      TEE_Param* params) {
  const trace_scope scope;
  trace(TEE_TRACE_INFO,
        "TA_InvokeCommandEntryPoint nCommandID 0x%x pSessionContext %p nParamTypes 0x%x\n",
        commandID, sessionContext, paramTypes);
  return dispatch(commandID, paramTypes, params);
}

}  // namespace keymaster
