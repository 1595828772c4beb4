// The product's attestation key: lists that are too short or too long do not compile.
#include "ta/attest/attestation_key.h"

#ifdef KEYMASTER_ATTESTATION_KEY
#include KEYMASTER_ATTESTATION_KEY
#else
#include "product/attestation_key.h"
#endif

namespace keymaster {

static_assert(sizeof(ATTESTATION_MODULUS) == 257, "257 bytes, the first one zero");
static_assert(sizeof(ATTESTATION_PUBLIC_EXPONENT) == 3, "3 bytes");
static_assert(sizeof(ATTESTATION_PRIVATE_EXPONENT) == 256, "256 bytes");
static_assert(sizeof(ATTESTATION_CERTIFICATE) == ATTESTATION_CERTIFICATE_SIZE, "783 bytes");

const attestation_key_t ATTESTATION_KEY = {ATTESTATION_MODULUS, ATTESTATION_PUBLIC_EXPONENT,
                                           ATTESTATION_PRIVATE_EXPONENT, ATTESTATION_CERTIFICATE};

}  // namespace keymaster
