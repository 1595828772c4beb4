// Keys on their way into the platform.
#include <algorithm>

#include "ports/adapter/hasher.h"
#include "ports/adapter/key_numbers.h"

namespace keymaster::adapter {
namespace {

using attributes_t = std::span<const TEE_Attribute>;

constexpr size_t SHA256_SIZE = 32;

// A key is loaded anew for every operation, and its numbers need to be looked at once: the digests
// of those that were found good last. Instance state, and public: what it is made from has more
// secret bits than it has.
constexpr size_t REMEMBERED_KEYS = 32;
uint8_t remembered[REMEMBERED_KEYS][SHA256_SIZE];
size_t next_remembered = 0;

bool is_pair(attributes_t attributes) {
  return has_attribute(attributes, TEE_ATTR_RSA_PRIVATE_EXPONENT) ||
         has_attribute(attributes, TEE_ATTR_ECC_PRIVATE_VALUE);
}

TEE_Result check_numbers(attributes_t attributes) {
  const bool rsa = has_attribute(attributes, TEE_ATTR_RSA_PRIVATE_EXPONENT);
  return rsa ? check_rsa_numbers(attributes) : check_ec_numbers(attributes);
}

template <class T>
void hash_value(hasher* hash, const T& value) {
  hash->update({reinterpret_cast<const uint8_t*>(&value), sizeof(value)});
}

// Digest of every attribute: which one, how long, its bytes.
TEE_Result identify(attributes_t attributes, digest_bytes* digest) {
  hasher hash;
  if (TEE_Result res = hash.begin(TEE_ALG_SHA256)) return res;
  for (const TEE_Attribute& attribute : attributes) {
    hash_value(&hash, attribute.attributeID);
    if ((attribute.attributeID & TEE_ATTR_FLAG_VALUE) != 0) {
      hash_value(&hash, attribute.content.value.a);
      continue;
    }
    const auto& content = attribute.content.ref;
    hash_value(&hash, content.length);
    hash.update({static_cast<const uint8_t*>(content.buffer), content.length});
  }
  return hash.finish(digest);
}

bool is_remembered(byte_view digest) {
  return std::ranges::any_of(remembered,
                             [&](byte_view known) { return equal_constant_time(known, digest); });
}

void remember(byte_view digest) {
  copy_bytes(remembered[next_remembered], digest);
  next_remembered = (next_remembered + 1) % REMEMBERED_KEYS;
}

TEE_Result check_once(attributes_t attributes) {
  digest_bytes bytes;
  if (TEE_Result res = identify(attributes, &bytes)) return res;
  const byte_view digest = byte_view(bytes).first(SHA256_SIZE);
  if (is_remembered(digest)) return TEE_SUCCESS;
  if (TEE_Result res = check_numbers(attributes)) return res;
  remember(digest);
  return TEE_SUCCESS;
}

}  // namespace

extern "C" TEE_Result wrapped_populate(TEE_ObjectHandle object, const TEE_Attribute* attributes,
                                       uint32_t count) ADAPTER_WRAPPED(TEE_PopulateTransientObject);
TEE_Result wrapped_populate(TEE_ObjectHandle object, const TEE_Attribute* attributes,
                            uint32_t count) {
  const attributes_t given(attributes, count);
  if (is_pair(given)) {
    if (TEE_Result res = check_once(given)) return res;
  }
  return platform_populate(object, attributes, count);
}

}  // namespace keymaster::adapter
