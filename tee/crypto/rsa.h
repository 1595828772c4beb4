// RSA operations (RFC 8017): raw, PKCS#1 v1.5, OAEP and PSS.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/key.h"

namespace tee::crypto {

// modulus_length: of a key, in bytes.
size_t modulus_length(const key& rsa_key);

// What OAEP takes beside the algorithm (RFC 8017, 7.1).
struct oaep_options {
  std::span<const uint8_t> label{};
  hash mask_digest = hash::NONE;  // of MGF1; NONE: the algorithm's

  bool usual() const { return label.empty() && mask_digest == hash::NONE; }
};

// rsa_encrypt, rsa_decrypt: with a row of family RSA_ENCRYPTION. Raw input of up to modulus_length
// bytes is a number below the modulus; a raw result is a number without leading zeros, zero being
// one byte; `oaep` counts with that padding alone. TEE_ERROR_BAD_PARAMETERS, and *result untouched,
// for a raw number that is not below the modulus, a message that is too long, and a ciphertext of
// another length than the modulus or whose padding is wrong.
[[nodiscard]] TEE_Result rsa_encrypt(key& rsa_key, const algorithm& row, const oaep_options& oaep,
                                     std::span<const uint8_t> input, secret_bytes* result);
[[nodiscard]] TEE_Result rsa_decrypt(key& rsa_key, const algorithm& row, const oaep_options& oaep,
                                     std::span<const uint8_t> input, secret_bytes* result);

// Length of a PSS salt: a number of bytes, or one of the codes TEE_PSS_SALT_. Absent: as long as
// the digest.
using pss_salt = std::optional<uint32_t>;

// rsa_sign: with a row of family RSA_SIGNATURE; `digest` is as long as the row's digest. Writes
// modulus_length bytes. TEE_ERROR_BAD_PARAMETERS when the key is too small for digest and salt, or
// is not a working key.
[[nodiscard]] TEE_Result rsa_sign(key& rsa_key, const algorithm& row, pss_salt salt,
                                  std::span<const uint8_t> digest, uint8_t* signature);

// rsa_verify: whether the signature is good; one of another length than the modulus never is.
[[nodiscard]] bool rsa_verify(key& rsa_key, const algorithm& row, pss_salt salt,
                              std::span<const uint8_t> digest, std::span<const uint8_t> signature);

// export_public_key: the DER SubjectPublicKeyInfo (RFC 5280, 4.1.2.7) of an RSA or EC key.
secret_bytes export_public_key(const key& any_key);

}  // namespace tee::crypto
