// What a product provisions for attestation: the attestation key and its certificate. The numbers
// stand in a file of their own, provisioned_key.cpp, which a product replaces (CMake option
// KEYMASTER_ATTESTATION_KEY).
#pragma once

#include <cstdint>

#include "base/bytes.h"

namespace keymaster {

// The stored certificate is copied into every chain as it stands; clients know its size.
constexpr size_t ATTESTATION_CERTIFICATE_SIZE = 783;

// RSA-2048, big-endian: a modulus of 257 bytes with a leading zero, a public exponent of 3 bytes, a
// private exponent of 256 bytes.
extern const uint8_t ATTESTATION_MODULUS[257];
extern const uint8_t ATTESTATION_PUBLIC_EXPONENT[3];
extern const uint8_t ATTESTATION_PRIVATE_EXPONENT[256];
extern const uint8_t ATTESTATION_CERTIFICATE[ATTESTATION_CERTIFICATE_SIZE];

// The verified boot key that every root of trust names: the platform offers no other.
constexpr char VERIFIED_BOOT_KEY[] = "58203947165029384756102938475610";
constexpr size_t VERIFIED_BOOT_KEY_SIZE = sizeof(VERIFIED_BOOT_KEY) - 1;
static_assert(VERIFIED_BOOT_KEY_SIZE == 32);

}  // namespace keymaster
