// RSA keys and operations (RFC 8017). Key material: a key record (key_record.h) of modulus, public
// exponent, private exponent, prime 1, prime 2, exponent 1, exponent 2 and coefficient. Key data to
// import is the same without the size field.
#pragma once

#include "ta/alg/algorithm.h"
#include "ta/base/tee_handles.h"

namespace keymaster {

extern const algorithm_t RSA_ALGORITHM;

// rsa_generate_key, rsa_import_key: check the description, complete it into the characteristics
// and build the key material from a fresh key, or from `key_data`. -38: a tag that only the TA may
// set, or one absent or repeated. -6: a size above 8192 bits or not whole bytes. -44: key size or
// public exponent given are not those of the data. TEE_ERROR_GENERIC: the data is too short; what
// follows the eighth number is ignored. Import takes the numbers as they are: a key that is none is
// refused when it is used.
outcome rsa_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material);
outcome rsa_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                       heap_buffer* key_material);

// rsa_export_key: writes the DER SubjectPublicKeyInfo (RFC 5280). Every failure is -1000.
outcome rsa_export_key(byte_view key_material, byte_span output, size_t* produced);

// rsa_set_key_info: fills the subject public key of a certificate. TEE_ERROR_GENERIC: the record is
// too short. -41: out of memory.
outcome rsa_set_key_info(byte_view key_material, X509_PUBKEY* subject_public_key);

// rsa_resolve_key_data: loads key material into the platform; *key_bits receives its size, or that
// of the modulus where zeros stand in front of it, as whole bytes. TEE_ERROR_GENERIC: the record is
// too short. TEE_ERROR_BAD_PARAMETERS: an even modulus, a number that is 0 or longer than the
// modulus, or the platform finds that the numbers are no key.
[[nodiscard]] TEE_Result rsa_resolve_key_data(byte_view key_material, tee_object* key,
                                              uint32_t* key_bits);

// resolve_key_from_data: the same for callers whose every failure is one: no object, traced.
tee_object resolve_key_from_data(byte_view key_material, uint32_t* key_bits);

// create_rsa_sign ... create_rsa_decrypt: begin an operation with KM_TAG_PADDING and KM_TAG_DIGEST
// of the request's parameters; encryption and decryption go without the digest unless the padding
// is OAEP. -38: absent or repeated. -12: no such digest. -10: a padding that the purpose does not
// offer. -13: the padding does not go with the digest, or PSS does not fit the key. -1000: the
// platform refuses the key, or a SOTER key's resources are not ready.
keymaster_error_t create_rsa_sign(const begin_request& request, operation_t** operation);
keymaster_error_t create_rsa_verify(const begin_request& request, operation_t** operation);
keymaster_error_t create_rsa_encrypt(const begin_request& request, operation_t** operation);
keymaster_error_t create_rsa_decrypt(const begin_request& request, operation_t** operation);

}  // namespace keymaster
