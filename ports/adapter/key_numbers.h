// Whether the numbers of a key pair belong together. A standard platform may take any and panic
// when they are used, so what a client imports is looked at before the platform gets it.
#pragma once

#include "tee_internal_api.h"

#include <span>

#include "ta/base/bytes.h"

namespace keymaster::adapter {

// check_rsa_numbers: TEE_SUCCESS for attributes of an RSA key pair with n = p q of two primes,
// e d = 1 modulo p - 1 and q - 1, likewise e with both exponents of the primes, and the coefficient
// the inverse of q modulo p; also for pairs without those five, of which nothing can be told
// cheaply. TEE_ERROR_BAD_PARAMETERS for others, for primes below 2^8, and for primes
// longer than the platform's arithmetic. TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result check_rsa_numbers(std::span<const TEE_Attribute> attributes);

// check_ec_numbers: TEE_SUCCESS for a point on the curve and a private value below the curve's
// order whose public point it is, and for curves that are not known here.
// TEE_ERROR_BAD_PARAMETERS for others; any other code is the platform's.
[[nodiscard]] TEE_Result check_ec_numbers(std::span<const TEE_Attribute> attributes);

// find_number: a buffer attribute's number without leading zeros; empty when it is not there.
[[nodiscard]] byte_view find_number(std::span<const TEE_Attribute> attributes, uint32_t id);

// has_attribute: whether `id` is among them.
[[nodiscard]] bool has_attribute(std::span<const TEE_Attribute> attributes, uint32_t id);

// is_below: whether a < b; neither has leading zeros.
[[nodiscard]] bool is_below(byte_view a, byte_view b);

}  // namespace keymaster::adapter
