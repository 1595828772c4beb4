// ECDSA (FIPS 186-4) with signatures as r || s, each as long as a field element and padded with
// zeros in front.
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/key.h"

namespace tee::crypto {

// signature_length: of a key's signatures, in bytes.
size_t signature_length(const key& ec_key);

// ecdsa_sign: writes signature_length bytes. `digest` may be of any length, also empty. A digest of
// more bits than the curve counts with its leftmost bits; one that is as long as a field element is
// taken as a finished number, which matters for P-521 alone. TEE_ERROR_BAD_PARAMETERS when the key
// is not a working key.
[[nodiscard]] TEE_Result ecdsa_sign(key& ec_key, std::span<const uint8_t> digest,
                                    uint8_t* signature);

// ecdsa_verify: whether the signature, of any length and content, is good.
[[nodiscard]] bool ecdsa_verify(key& ec_key, std::span<const uint8_t> digest,
                                std::span<const uint8_t> signature);

}  // namespace tee::crypto
