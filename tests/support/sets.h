// Parameter sets that several tests start from.
#pragma once

#include "client/param_set.h"

namespace keymaster::test {

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
