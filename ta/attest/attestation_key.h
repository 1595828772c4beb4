// The provisioned attestation key and its certificate.
#pragma once

#include <cstdint>

#include "ta/base/bytes.h"

namespace keymaster {

// The stored certificate is copied into every chain as it stands; clients know its size.
constexpr size_t ATTESTATION_CERTIFICATE_SIZE = 783;

// attestation_key_t: RSA-2048, big-endian, and the certificate in DER, as the product's file has
// them (CMake option KEYMASTER_ATTESTATION_KEY).
struct attestation_key_t {
  const uint8_t (&modulus)[257];  // with a leading zero
  const uint8_t (&public_exponent)[3];
  const uint8_t (&private_exponent)[256];
  const uint8_t (&certificate)[ATTESTATION_CERTIFICATE_SIZE];
};
extern const attestation_key_t ATTESTATION_KEY;

}  // namespace keymaster
