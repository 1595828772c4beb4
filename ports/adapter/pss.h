// EMSA-PSS (RFC 8017, 9.1) with MGF1 under the same digest: what a standard platform does not offer
// of it, which is to verify a signature whose salt may have any length.
#pragma once

#include "tee_internal_api.h"

#include "ta/base/bytes.h"

namespace keymaster::adapter {

// pss_digest_size: bytes of a TEE_ALG_SHA* digest.
[[nodiscard]] size_t pss_digest_size(uint32_t digest);

// pss_encoded_size: bytes of the block that is signed under a modulus without leading zeros; one
// less than the modulus has when that is a multiple of eight bits and one.
[[nodiscard]] size_t pss_encoded_size(byte_view modulus);

// pss_longest_salt: bytes of the longest salt that fits beside the digest; 0 when none does.
[[nodiscard]] size_t pss_longest_salt(byte_view modulus, size_t digest_size);

// pss_verify: whether `block`, which is as long as the modulus and is unmasked in place, encodes
// `hash`, a digest of the kind `digest`, with a salt of any length. TEE_SUCCESS;
// TEE_ERROR_SIGNATURE_INVALID; TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result pss_verify(uint32_t digest, byte_view modulus, byte_view hash,
                                    byte_span block);

}  // namespace keymaster::adapter
