// Keys on the NIST prime curves (FIPS 186-4): from their numbers, and new ones.
#pragma once

#include "tee/crypto/key.h"

namespace tee::crypto {

// load_ec_key: a key pair (curve, X, Y, private value) or a public key, from attributes in table
// order. TEE_ERROR_BAD_PARAMETERS for an unknown curve or one above `max_bits`, a point that is not
// on the curve, a private value outside of 1 to the order - 1, and one that is not the point's.
[[nodiscard]] TEE_Result load_ec_key(uint32_t type, uint32_t max_bits,
                                     std::vector<attribute> attributes, key_ptr* result);

// generate_ec_key: a new key pair. See generate_key for the parameters.
[[nodiscard]] TEE_Result generate_ec_key(uint32_t bits, std::span<const attribute_view> parameters,
                                         key_ptr* result);

}  // namespace tee::crypto
