// EC keys on the NIST prime curves, and ECDSA (FIPS 186-4). Key material: a key record
// (key_record.h) of the public point's X and Y and the private value. Key data to import is the
// same; an exported key is the size field, X and Y.
#pragma once

#include "ta/alg/algorithm.h"
#include "ta/base/tee_handles.h"

namespace keymaster {

struct ASN1_OID;

extern const algorithm_t EC_ALGORITHM;

// ec_curve_t: what belongs to one curve.
struct ec_curve_t {
  uint32_t key_bits;
  uint32_t tee_curve;      // TEE_ECC_CURVE_*
  uint32_t tee_algorithm;  // TEE_ALG_ECDSA_*
  uint32_t km_curve;       // KM_EC_CURVE_*
  const ASN1_OID* name;    // null when no key of this size can be made

  size_t size() const { return (size_t{key_bits} + 7) / 8; }  // of a coordinate, in bytes
};

// find_ec_curve: the curve of this key size, or null.
const ec_curve_t* find_ec_curve(uint32_t key_bits);

// ec_generate_key, ec_import_key: check the description, complete it into the characteristics and
// build the key material from a fresh key, or from `key_data`. -38: a tag that only the TA may set,
// or a key size absent or repeated (generate). -44: the key size given is not that of the data. -6:
// a size other than 224, 256, 384 or 521 bits. TEE_ERROR_GENERIC: the data is too short; what
// follows the private value is ignored. Import takes the numbers as they are: a key that is none is
// refused when it is used.
outcome ec_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material);
outcome ec_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                      heap_buffer* key_material);

// ec_export_key: writes the public part of the record. TEE_ERROR_GENERIC: record or output are too
// short.
outcome ec_export_key(byte_view key_material, byte_span output, size_t* produced);

// ec_set_key_info: fills the subject public key of a certificate. TEE_ERROR_GENERIC: the record is
// too short. -41: out of memory. -1000: no named curve of its size.
outcome ec_set_key_info(byte_view key_material, X509_PUBKEY* subject_public_key);

// ec_resolve_key_data: loads key material into the platform; *curve receives the key's.
// TEE_ERROR_GENERIC: the record is too short. -6: no curve of its size. TEE_ERROR_BAD_PARAMETERS: a
// number that is 0 or longer than the curve's, or the platform finds that the numbers are no key.
outcome ec_resolve_key_data(byte_view key_material, tee_object* key, const ec_curve_t** curve);

}  // namespace keymaster
