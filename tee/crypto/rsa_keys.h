// RSA keys (RFC 8017): from their numbers, and new ones.
#pragma once

#include "tee/crypto/key.h"

namespace tee::crypto {

// load_rsa_key: a key pair (modulus, both exponents, and all five CRT numbers or none) or a public
// key, from attributes in table order. TEE_ERROR_BAD_PARAMETERS for a modulus that is even, below
// 512 bits or above `max_bits`; a public exponent that is even, below 3 or above the modulus (above
// 64 bits when the modulus has more than 3072, which libcrypto does not take); and a private half
// that does not belong to the public one.
[[nodiscard]] TEE_Result load_rsa_key(uint32_t type, uint32_t max_bits,
                                      std::vector<attribute> attributes, key_ptr* result);

// generate_rsa_key: a new key pair with its CRT numbers. See generate_key for the parameters.
[[nodiscard]] TEE_Result generate_rsa_key(uint32_t bits, std::span<const attribute_view> parameters,
                                          key_ptr* result);

}  // namespace tee::crypto
