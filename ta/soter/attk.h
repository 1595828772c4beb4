// The device's key for SOTER (ATTK) as a key of the platform, and public keys as PEM.
#pragma once

#include "tee_internal_api.h"

#include "ta/base/tee_handles.h"
#include "ta/soter/provisioning.h"

namespace keymaster {

// convert_key_to_object: the key pair as an RSA key object; none when the platform has no room or
// refuses the key. *key_bits receives 2048, the size that every ATTK has.
[[nodiscard]] tee_object convert_key_to_object(const soter_key_pair_t& key_pair,
                                               uint32_t* key_bits);

// export_rsa_public_key: the public half of an RSA key of `key_bits` as PEM (RFC 7468) of its
// SubjectPublicKeyInfo, without a newline at the end and with a terminating zero, which *length
// counts. Written to `buffer` once, whole; 0 bytes on failure. TEE_ERROR_SHORT_BUFFER when it does
// not fit; TEE_ERROR_OUT_OF_MEMORY; otherwise the platform's code.
[[nodiscard]] TEE_Result export_rsa_public_key(TEE_ObjectHandle key, uint32_t key_bits,
                                               byte_span buffer, size_t* length);

}  // namespace keymaster
