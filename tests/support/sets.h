// Purposes and parameter sets that several tests start from.
#pragma once

#include "keymaster/client/param_set.h"

namespace keymaster::test {

constexpr uint32_t ENCRYPT = KM_PURPOSE_ENCRYPT;
constexpr uint32_t DECRYPT = KM_PURPOSE_DECRYPT;
constexpr uint32_t SIGN = KM_PURPOSE_SIGN;
constexpr uint32_t VERIFY = KM_PURPOSE_VERIFY;

inline client::param_set one(keymaster_tag_t tag, uint64_t number) {
  return client::param_set().add(tag, number);
}

// several: one parameter of that tag for each number.
inline client::param_set several(keymaster_tag_t tag, std::initializer_list<uint32_t> numbers) {
  client::param_set set;
  for (const uint32_t number : numbers)
    set.add(tag, number);
  return set;
}

// without: `set` less its parameters of that tag.
inline client::param_set without(const client::param_set& set, keymaster_tag_t tag) {
  client::param_set result;
  for (const client::param& kept : set) {
    if (kept.tag == tag) continue;
    if (has_blob(kept.tag)) {
      result.add_bytes(kept.tag, kept.data);
    } else {
      result.add(kept.tag, kept.number);
    }
  }
  return result;
}

// bound_to: what binds a key to an application, and what one presents; no data when that is empty.
inline client::param_set bound_to(std::string_view id, std::string_view data = {}) {
  client::param_set set;
  set.add_bytes(KM_TAG_APPLICATION_ID, client::as_bytes(id));
  return data.empty() ? set : set.add_bytes(KM_TAG_APPLICATION_DATA, client::as_bytes(data));
}

// with: `set`, its parameters of that tag replaced by one for each number.
inline client::param_set with(const client::param_set& set, keymaster_tag_t tag,
                              std::initializer_list<uint32_t> numbers) {
  return without(set, tag).append(several(tag, numbers));
}

// any_use: a key for all that RSA, AES and EC keys can be asked for, and for some that none can.
constexpr uint32_t UNKNOWN_MODE = 99;
constexpr uint32_t UNKNOWN_PADDING = 9;
constexpr uint32_t UNKNOWN_DIGEST = 7;
inline client::param_set any_use(uint32_t algorithm) {
  return one(KM_TAG_ALGORITHM, algorithm)
      .append(several(KM_TAG_PURPOSE, {ENCRYPT, DECRYPT, SIGN, VERIFY}))
      .append(several(KM_TAG_BLOCK_MODE,
                      {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM, UNKNOWN_MODE}))
      .append(several(KM_TAG_PADDING, {1, 2, 3, 4, 5, KM_PAD_PKCS7, UNKNOWN_PADDING}))
      .append(several(KM_TAG_DIGEST, {0, 1, 2, 3, 4, 5, 6, UNKNOWN_DIGEST}))
      .add(KM_TAG_MIN_MAC_LENGTH, 96)
      .add_flag(KM_TAG_CALLER_NONCE)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
}

// hmac_key: a key that may sign and verify, of `bits` or, imported, of its data's size.
inline client::param_set hmac_key(uint32_t bits = 0, uint32_t digest = KM_DIGEST_SHA_2_256) {
  client::param_set key = one(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC);
  if (bits != 0) key.add(KM_TAG_KEY_SIZE, bits);
  return key.add(KM_TAG_DIGEST, digest)
      .add(KM_TAG_MIN_MAC_LENGTH, 64)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
}

// mac_use: what a begin with such a key asks for.
inline client::param_set mac_use(uint32_t mac_bits = 256, uint32_t digest = KM_DIGEST_SHA_2_256) {
  return one(KM_TAG_DIGEST, digest).add(KM_TAG_MAC_LENGTH, mac_bits);
}

}  // namespace keymaster::test
