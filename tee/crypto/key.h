// Keys: a type, its attributes in canonical form, and what libcrypto has made of them.
#pragma once

#include "tee_internal_api.h"

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/context_pool.h"
#include "tee/crypto/openssl.h"
#include "tee/device/secret_bytes.h"

namespace tee::crypto {

// One attribute. TEE_ATTR_FLAG_VALUE in the identifier tells which members count.
struct attribute {
  uint32_t id = 0;
  secret_bytes bytes;  // buffer attributes
  uint32_t a = 0;      // value attributes
  uint32_t b = 0;

  bool is_value() const { return (id & TEE_ATTR_FLAG_VALUE) != 0; }
};

// An attribute whose bytes are somebody else's: what a key is made of, or found by.
struct attribute_view {
  uint32_t id = 0;
  std::span<const uint8_t> bytes;
  uint32_t a = 0;
  uint32_t b = 0;
};

// A key never changes after it is made; objects and operations share it. Its spare contexts are
// working memory: those who share a key must not use it at the same time.
class key {
 public:
  key(uint32_t type, uint32_t bits, std::vector<attribute> attributes, pkey_ptr pkey)
      : type_(type), bits_(bits), attributes_(std::move(attributes)), pkey_(std::move(pkey)) {}
  key(const key&) = delete;
  key& operator=(const key&) = delete;

  uint32_t type() const { return type_; }  // TEE_TYPE_
  uint32_t bits() const { return bits_; }  // modulus, secret or curve size

  // attributes: in the order of the type's table. RSA numbers have no leading zeros, EC numbers are
  // padded to the field's length.
  const std::vector<attribute>& attributes() const { return attributes_; }

  // find: the attribute, or null.
  const attribute* find(uint32_t id) const;

  // secret: the bytes of a symmetric key.
  std::span<const uint8_t> secret() const { return attributes_.front().bytes; }

  // pkey: libcrypto's form of an RSA or EC key; null for symmetric ones.
  EVP_PKEY* pkey() const { return pkey_.get(); }

  // Contexts that were made ready for this key and are not in use.
  context_pool<pkey_ctx_ptr> pkey_contexts;
  context_pool<mac_ctx_ptr> mac_contexts;
  context_pool<cipher_ctx_ptr> cipher_contexts;

 private:
  uint32_t type_;
  uint32_t bits_;
  std::vector<attribute> attributes_;
  pkey_ptr pkey_;
};

using key_ptr = std::shared_ptr<key>;

// find_attribute: the first one with this identifier, or null.
const attribute_view* find_attribute(std::span<const attribute_view> attributes, uint32_t id);

// The attributes of a key that is to be made: given in any order, held in the order of the type's
// table.
class attribute_list {
 public:
  // The type must be in the table.
  explicit attribute_list(const key_type& type) : type_(type) {}

  const key_type& type() const { return type_; }

  // add, complete: null, or the rule that the list breaks: an attribute that does not belong to the
  // type or is given twice; a mandatory one that is missing. complete() is called once, after the
  // last add().
  [[nodiscard]] const char* add(const attribute_view& given);
  [[nodiscard]] const char* complete();

  // views: what a complete list holds. An empty optional attribute counts as absent.
  std::span<const attribute_view> views() const { return {views_.data(), count_}; }

 private:
  const key_type& type_;
  std::array<attribute_view, MAX_ATTRIBUTES> views_{};  // by place in the table, then moved up
  std::array<bool, MAX_ATTRIBUTES> given_{};
  size_t count_ = 0;
};

// without_leading_zeros: the significant bytes of a big-endian number.
std::span<const uint8_t> without_leading_zeros(std::span<const uint8_t> number);

// load_key: makes a key of a complete list, whose numbers may have leading zeros.
// TEE_ERROR_BAD_PARAMETERS when the values are wrong or do not fit each other, or when the key is
// larger than `max_bits`; *result is untouched then.
[[nodiscard]] TEE_Result load_key(const attribute_list& attributes, uint32_t max_bits,
                                  key_ptr* result);

// generate_key: makes a new key of exactly `bits`, a size that the type's table allows.
// `parameters`: RSA takes an optional public exponent (default 65537), EC needs the curve,
// symmetric types take none. TEE_ERROR_BAD_PARAMETERS for others, for an exponent that is even,
// below 3 or above 64 bits, and for a curve of another size.
[[nodiscard]] TEE_Result generate_key(uint32_t type, uint32_t bits,
                                      std::span<const attribute_view> parameters, key_ptr* result);

}  // namespace tee::crypto
