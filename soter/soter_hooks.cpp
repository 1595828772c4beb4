// The hooks that RSA signing calls for SOTER keys. The device data that they need is not provided
// yet, so no SOTER operation ever begins.
#include "keymaster/alg/rsa/soter_hooks.h"

namespace keymaster {

TEE_Result soter_check_resources() {
  return TEE_ERROR_NOT_SUPPORTED;
}

TEE_Result soter_enhance_sign_finish(rsa_sign_operation_t*, const keymaster_key_param_set_t&,
                                     byte_view, heap_buffer*) {
  return TEE_ERROR_NOT_SUPPORTED;
}

}  // namespace keymaster
