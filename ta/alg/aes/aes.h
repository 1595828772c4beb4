// AES keys and operations (FIPS 197) in the modes ECB, CBC and CTR (NIST SP 800-38A) and GCM (NIST
// SP 800-38D). Key material: u32 key size in bits, then the key's bytes.
#pragma once

#include "ta/alg/algorithm.h"
#include "ta/base/tee_handles.h"

namespace keymaster {

extern const algorithm_t AES_ALGORITHM;

// aes_generate_key, aes_import_key: check the description, complete it into the characteristics and
// build the key material from a fresh key, or from `key_data`, which is the bare key. -38: a tag
// that only the TA may set, a key size absent or repeated (generate), a minimum MAC length without
// GCM. -44: the key size given is not that of the data. -6: a size other than 128, 192 or 256 bits.
// -58, -59: with GCM, a minimum MAC length absent or repeated, or not one of 96, 104 ... 128 bits.
outcome aes_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material);
outcome aes_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                       heap_buffer* key_material);

// aes_resolve_key_data: loads key material into the platform; *key_bits receives its size.
// TEE_ERROR_GENERIC: the record is too short.
[[nodiscard]] TEE_Result aes_resolve_key_data(byte_view key_material, tee_object* key,
                                              uint32_t* key_bits);

// create_aes_encrypt, create_aes_decrypt: begin an operation with KM_TAG_BLOCK_MODE, KM_TAG_PADDING
// (NONE when absent), KM_TAG_MAC_LENGTH (GCM, bits) and KM_TAG_NONCE of the request's parameters. A
// nonce that is not given is drawn at random; unless the mode is ECB, the nonce used goes to
// *out_params. -38: block mode or MAC length absent or repeated, or a nonce of the wrong length.
// -9: MAC length. -11: the mode does not take the padding. -7: no such mode. -40: a nonce with ECB.
keymaster_error_t create_aes_encrypt(const begin_request& request, operation_t** operation);
keymaster_error_t create_aes_decrypt(const begin_request& request, operation_t** operation);

}  // namespace keymaster
