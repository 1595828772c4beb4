// Keys found again.
#include "tee/crypto/key_cache.h"

#include <algorithm>

#include "tee/crypto/fetched.h"

namespace tee::crypto {
namespace {

template <typename Word>
void hash_word(EVP_MD_CTX* context, Word word) {
  must(EVP_DigestUpdate(context, &word, sizeof(word)) == 1, "EVP_DigestUpdate");
}

}  // namespace

// Over the type, and of every attribute the identifier and the two numbers of a value, or the
// length and the bytes of a buffer: numbers by their value, secrets as they are.
key_cache::digest key_cache::name_of(uint32_t type, const std::vector<attribute>& attributes) {
  if (!context_) context_.reset(EVP_MD_CTX_new());
  EVP_MD_CTX* context = context_.get();
  must(context && EVP_DigestInit_ex2(context, digest_of(hash::SHA256), nullptr) == 1,
       "EVP_DigestInit_ex2");
  hash_word(context, type);
  bool symmetric = find_key_type(type)->symmetric();
  for (const attribute& given : attributes) {
    hash_word(context, given.id);
    hash_word(context, given.a);
    hash_word(context, given.b);
    std::span<const uint8_t> bytes = given.bytes;
    if (!symmetric) bytes = without_leading_zeros(bytes);
    hash_word(context, uint64_t{bytes.size()});
    must(EVP_DigestUpdate(context, bytes.data(), bytes.size()) == 1, "EVP_DigestUpdate");
  }
  digest name;
  must(EVP_DigestFinal_ex(context, name.data(), nullptr) == 1, "EVP_DigestFinal_ex");
  return name;
}

TEE_Result key_cache::load(uint32_t type, uint32_t max_bits, std::vector<attribute> attributes,
                           key_ptr* result) {
  std::vector<attribute> ordered = in_table_order(type, std::move(attributes));
  digest name = name_of(type, ordered);
  auto found = std::find_if(held_.begin(), held_.end(),
                            [&](const entry& held) { return held.name == name; });
  if (found != held_.end()) {
    if (found->value->bits() > max_bits) return TEE_ERROR_BAD_PARAMETERS;
    std::rotate(held_.begin(), found, found + 1);
    *result = held_.front().value;
    return TEE_SUCCESS;
  }
  if (TEE_Result res = load_key(type, max_bits, std::move(ordered), result)) return res;
  hold(name, *result);
  return TEE_SUCCESS;
}

void key_cache::add(const key_ptr& made) {
  hold(name_of(made->type(), made->attributes()), made);
}

void key_cache::hold(const digest& name, const key_ptr& value) {
  if (held_.size() == SIZE) held_.pop_back();
  held_.insert(held_.begin(), {name, value});
}

}  // namespace tee::crypto
