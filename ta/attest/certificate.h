// Attestation certificates (RFC 5280): one for the key, signed with the device's attestation key,
// and the stored certificate of that key behind it.
#pragma once

#include "ta/base/outcome.h"
#include "ta/base/tee_handles.h"
#include "ta/der/x509.h"
#include "ta/params/param_set.h"

namespace keymaster {

// get_attest_key: the attestation key as an object of the platform. Every algorithm is attested
// with the same RSA-2048 key: `algorithm` is not looked at. On failure *key is empty, the Keymaster
// error -1000.
outcome get_attest_key(uint32_t algorithm, tee_object* key);

// X509_CINF_sign: encodes the to-be-signed part, signs it with `key` as its `signature` field says
// (RSA PKCS #1 v1.5 with MD5, SHA-1, SHA-256, SHA-384 or SHA-512) and encodes the certificate into
// `certificate`, in TA memory. Keymaster errors: -41 it is longer than `capacity` bytes, or out of
// memory; -1000 a value cannot be encoded. TEE_ERROR_NOT_SUPPORTED: another signature algorithm;
// otherwise the platform's code.
outcome X509_CINF_sign(const X509_CINF* cinf, const tee_object& key, size_t capacity,
                       heap_buffer* certificate);

// attested_key: the key that a chain is for, and what the caller asks of it.
struct attested_key {
  byte_view material;
  const keymaster_key_param_set_t& characteristics;
  const keymaster_key_param_set_t& params;
};

// internal_attest_key: writes the chain: u32 length and the new certificate, u32 length and the
// stored one. *count receives how many certificates were written, *produced the bytes.
// TEE_ERROR_GENERIC: `output` is too small for a length or for the stored certificate. Keymaster
// errors: -4 the algorithm cannot be attested; -41 the new certificate does not fit, or out of
// memory; those of the key description; -1000.
outcome internal_attest_key(const attested_key& key, byte_span output, size_t* produced,
                            uint32_t* count);

}  // namespace keymaster
