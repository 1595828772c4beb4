// What signing with SOTER keys needs of the SOTER code. Declared here and defined above, in soter/,
// so that the algorithms stay below it.
#pragma once

#include "ta/alg/rsa/rsa_operation.h"

namespace keymaster {

// soter_check_resources: TEE_SUCCESS when what signing needs of the device is loaded; loads it at
// first need.
[[nodiscard]] TEE_Result soter_check_resources();

// soter_enhance_sign_finish: wraps `message`, the whole message given to a SOTER key's sign
// operation, into a document, signs that with the operation's own hash, key and padding, and puts
// document and signature into *output. `key_params` are the key's characteristics.
[[nodiscard]] TEE_Result soter_enhance_sign_finish(rsa_sign_operation_t* operation,
                                                   const keymaster_key_param_set_t& key_params,
                                                   byte_view message, heap_buffer* output);

}  // namespace keymaster
