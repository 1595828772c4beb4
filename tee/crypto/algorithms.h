// What the platform can compute: one row for each algorithm identifier, one for each key type.
#pragma once

#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <cstdint>
#include <span>

namespace tee::crypto {

enum class family : uint8_t { DIGEST, MAC, CIPHER, AE, RSA_ENCRYPTION, RSA_SIGNATURE, ECDSA };
enum class hash : uint8_t { NONE, MD5, SHA1, SHA224, SHA256, SHA384, SHA512 };
enum class block_mode : uint8_t { NONE, ECB, CBC, CTR, GCM };
enum class rsa_padding : uint8_t { NONE, PKCS1, OAEP, PSS };

constexpr size_t AES_BLOCK = 16;  // bytes

struct algorithm {
  uint32_t id = 0;  // TEE_ALG_
  family kind = family::DIGEST;
  uint32_t modes = 0;     // bit n: TEE_MODE_ n
  uint32_t key_type = 0;  // TEE_TYPE_ of the secret key or the key pair; 0: takes no key
  hash digest = hash::NONE;
  block_mode mode = block_mode::NONE;
  rsa_padding padding = rsa_padding::NONE;
  uint32_t curve_bits = 0;  // 0: any curve

  constexpr bool allows(uint32_t operation_mode) const {
    return operation_mode < 32 && ((modes >> operation_mode) & 1) != 0;
  }
};

// find_algorithm: the row; null when the platform has no such algorithm.
const algorithm* find_algorithm(uint32_t id);

constexpr size_t MAX_ATTRIBUTES = 8;  // of any key type

// An attribute that a key type has.
struct attribute_rule {
  uint32_t id;
  enum : uint8_t { MANDATORY, OPTIONAL } presence;
};

struct key_type {
  uint32_t id;        // TEE_TYPE_
  uint32_t min_bits;  // sizes from min to max in steps of step_bits; a step of 0: the curve sizes
  uint32_t max_bits;
  uint32_t step_bits;
  std::span<const attribute_rule> attributes;

  // allows: whether keys of this size can be made.
  bool allows(uint32_t bits) const;
  // place_of: where in `attributes` it is; their number when it does not belong here.
  size_t place_of(uint32_t attribute_id) const;
  bool has(uint32_t attribute_id) const { return place_of(attribute_id) < attributes.size(); }
  bool symmetric() const { return attributes.size() == 1; }
};

// find_key_type: the row; null when the platform has no such type.
const key_type* find_key_type(uint32_t id);

// public_type_of: the public key type that goes with a key pair type; 0 for symmetric ones.
constexpr uint32_t public_type_of(uint32_t pair_type) {
  switch (pair_type) {
    case TEE_TYPE_RSA_KEYPAIR:
      return TEE_TYPE_RSA_PUBLIC_KEY;
    case TEE_TYPE_ECDSA_KEYPAIR:
      return TEE_TYPE_ECDSA_PUBLIC_KEY;
    default:
      return 0;
  }
}

// An elliptic curve over a prime field (FIPS 186-4, D.1.2; libcrypto's name).
struct curve {
  uint32_t id;  // TEE_ECC_CURVE_
  uint32_t bits;
  const char* name;

  constexpr size_t length() const { return (bits + 7) / 8; }  // of a field element, in bytes
};

// find_curve, curve_of_size: the row; null when there is none.
const curve* find_curve(uint32_t id);
const curve* curve_of_size(uint32_t bits);

}  // namespace tee::crypto
