// Keys found again.
#include "tee/crypto/key_cache.h"

#include <algorithm>
#include <openssl/crypto.h>

#include "tee/crypto/algorithms.h"

namespace tee::crypto {
namespace {

// Secrets are the same when their bytes are, numbers when their values are.
bool same_bytes(const key_type& type, std::span<const uint8_t> a, std::span<const uint8_t> b) {
  if (!type.symmetric()) {
    a = without_leading_zeros(a);
    b = without_leading_zeros(b);
  }
  return a.size() == b.size() && CRYPTO_memcmp(a.data(), b.data(), a.size()) == 0;
}

// Whether `held` is what load_key would make of `wanted`. Every attribute is looked at, so that the
// time does not tell how far two keys agree.
bool same_key(const key& held, const attribute_list& wanted) {
  std::span<const attribute_view> views = wanted.views();
  if (held.type() != wanted.type().id || held.attributes().size() != views.size()) return false;
  bool same = true;
  for (size_t i = 0; i < views.size(); ++i) {
    const attribute& ours = held.attributes()[i];
    const attribute_view& given = views[i];
    same &= ours.id == given.id && ours.a == given.a &&
            same_bytes(wanted.type(), ours.bytes, given.bytes);
  }
  return same;
}

}  // namespace

TEE_Result key_cache::load(const attribute_list& attributes, uint32_t max_bits, key_ptr* result) {
  auto found = std::find_if(held_.begin(), held_.end(),
                            [&](const key_ptr& held) { return same_key(*held, attributes); });
  if (found != held_.end()) {
    if ((*found)->bits() > max_bits) return TEE_ERROR_BAD_PARAMETERS;
    std::rotate(held_.begin(), found, found + 1);
    *result = held_.front();
    return TEE_SUCCESS;
  }
  if (TEE_Result res = load_key(attributes, max_bits, result)) return res;
  add(*result);
  return TEE_SUCCESS;
}

void key_cache::add(const key_ptr& made) {
  if (held_.size() == SIZE) held_.pop_back();
  held_.insert(held_.begin(), made);
}

}  // namespace tee::crypto
