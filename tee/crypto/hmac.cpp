// HMAC.
#include "tee/crypto/hmac.h"

#include "tee/crypto/fetched.h"

namespace tee::crypto {
namespace {

mac_ctx_ptr keyed_context(const key& key, hash which) {
  mac_ctx_ptr context = new_hmac(which);
  std::span<const uint8_t> secret = key.secret();
  must(EVP_MAC_init(context.get(), secret.data(), secret.size(), nullptr) == 1, "EVP_MAC_init");
  return context;
}

}  // namespace

hmac::hmac(key_ptr key, hash which)
    : key_(std::move(key)),
      which_(which),
      length_(length_of(which)),
      context_(key_->mac_contexts.take(static_cast<uint64_t>(which))) {
  if (!context_) context_ = keyed_context(*key_, which);
}

hmac::~hmac() {
  if (context_) key_->mac_contexts.give(static_cast<uint64_t>(which_), std::move(context_));
}

void hmac::start() {
  // Without a key: the one that the context has been given stays.
  must(EVP_MAC_init(context_.get(), nullptr, 0, nullptr) == 1, "EVP_MAC_init");
}

void hmac::update(std::span<const uint8_t> bytes) {
  must(EVP_MAC_update(context_.get(), bytes.data(), bytes.size()) == 1, "EVP_MAC_update");
}

void hmac::finish(uint8_t* result) {
  size_t written = 0;
  must(EVP_MAC_final(context_.get(), result, &written, length_) == 1 && written == length_,
       "EVP_MAC_final");
}

}  // namespace tee::crypto
