// What a product provisions for attestation: the attestation key and its certificate. The numbers
// stand in a file of their own, provisioned_key.cpp, which a product replaces (CMake option
// KEYMASTER_ATTESTATION_KEY).
#pragma once

#include <cstdint>

#include "base/bytes.h"

namespace keymaster {

// The stored certificate is copied into every chain as it stands; clients know its size.
constexpr size_t ATTESTATION_CERTIFICATE_SIZE = 783;

// RSA-2048, big-endian, and the certificate in DER.
struct attestation_key_t {
  const uint8_t (&modulus)[257];  // with a leading zero
  const uint8_t (&public_exponent)[3];
  const uint8_t (&private_exponent)[256];
  const uint8_t (&certificate)[ATTESTATION_CERTIFICATE_SIZE];
};
extern const attestation_key_t ATTESTATION_KEY;

// PROVISION_ATTESTATION_KEY: ends a product's file, which defines the four arrays without their
// sizes; a list that is too short or too long does not compile.
#define PROVISION_ATTESTATION_KEY(modulus, public_exponent, private_exponent, certificate)     \
  static_assert(sizeof(modulus) == 257, "attestation modulus: 257 bytes, the first one zero"); \
  static_assert(sizeof(public_exponent) == 3, "attestation public exponent: 3 bytes");         \
  static_assert(sizeof(private_exponent) == 256, "attestation private exponent: 256 bytes");   \
  static_assert(sizeof(certificate) == ATTESTATION_CERTIFICATE_SIZE,                           \
                "attestation certificate: 783 bytes");                                         \
  const attestation_key_t ATTESTATION_KEY = {modulus, public_exponent, private_exponent,       \
                                             certificate}

// The verified boot key that every root of trust names: the platform offers no other.
constexpr char VERIFIED_BOOT_KEY[] = "58203947165029384756102938475610";
constexpr size_t VERIFIED_BOOT_KEY_SIZE = sizeof(VERIFIED_BOOT_KEY) - 1;
static_assert(VERIFIED_BOOT_KEY_SIZE == 32);

}  // namespace keymaster
