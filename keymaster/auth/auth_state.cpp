// Creation and end of the authorisation state.
#include "keymaster/auth/auth_state.h"

#include "base/results.h"
#include "keymaster/auth/clock.h"
#include "keymaster/auth/token.h"
#include "keymaster/auth/use_log.h"

namespace keymaster {

TEE_Result authorizaiton_init() {
  if (TEE_Result res = auth_tokens_init()) return res;
  if (!use_log_init()) {
    auth_tokens_destroy();
    return TEE_FAIL(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  clock_init();
  return TEE_SUCCESS;
}

void authorization_destroy() {
  auth_tokens_destroy();
  use_log_destroy();
}

}  // namespace keymaster
