// Attestation certificates (RFC 5280): one for the key, signed with the device's attestation key,
// and the stored certificate of that key behind it.
#pragma once

#include "ta/base/tee_handles.h"
#include "ta/der/x509.h"
#include "ta/params/param_set.h"

namespace keymaster {

// get_attest_key: the attestation key as an object of the platform. Every algorithm is attested
// with the same RSA-2048 key: `algorithm` is not looked at. On failure *key is empty, *km_error is
// -1000 unless one was set.
[[nodiscard]] TEE_Result get_attest_key(uint32_t algorithm, tee_object* key,
                                        keymaster_error_t* km_error);

// X509_CINF_sign: encodes the to-be-signed part, signs it with `key` as its `signature` field says
// (RSA PKCS #1 v1.5 with MD5, SHA-1, SHA-256, SHA-384 or SHA-512) and encodes the certificate into
// `output`. The certificate's length; DER_TOO_SMALL, DER_NO_MEMORY; or a TEE code, which is
// negative as well (TEE_ERROR_NOT_SUPPORTED: another signature algorithm).
[[nodiscard]] int32_t X509_CINF_sign(const X509_CINF* cinf, const tee_object& key,
                                     byte_span output);

// internal_attest_key: writes the chain: u32 length and the new certificate, u32 length and the
// stored one. *count receives how many certificates were written, *produced the bytes.
// TEE_ERROR_GENERIC: `output` is too small for a length or for the stored certificate. Keymaster
// errors: -4 the algorithm cannot be attested; -41 the new certificate does not fit, or out of
// memory; those of the key description; -1000.
[[nodiscard]] TEE_Result internal_attest_key(byte_view key_material,
                                             const keymaster_key_param_set_t& key_params,
                                             const keymaster_key_param_set_t& attest_params,
                                             byte_span output, size_t* produced, uint32_t* count,
                                             keymaster_error_t* km_error);

}  // namespace keymaster
