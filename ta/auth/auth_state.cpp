// Creation and end of the authorisation state.
#include "ta/auth/auth_state.h"

#include "ta/auth/clock.h"
#include "ta/auth/token.h"
#include "ta/auth/use_log.h"
#include "ta/base/outcome.h"

namespace keymaster {

TEE_Result authorizaiton_init() {
  const trace_scope scope;
  TRY(auth_tokens_init());
  if (!use_log_init()) {
    auth_tokens_destroy();
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  clock_init();
  return TEE_SUCCESS;
}

void authorization_destroy() {
  auth_tokens_destroy();
  use_log_destroy();
}

}  // namespace keymaster
