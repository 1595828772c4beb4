// Message digests.
#include "tee/crypto/digest.h"

#include "tee/crypto/fetched.h"

namespace tee::crypto {

digest::digest(hash which, digest_pool* spares)
    : which_(which),
      spares_(spares),
      length_(length_of(which)),
      context_(spares->take(static_cast<uint64_t>(which))),
      ended_(context_ != nullptr) {
  if (context_) return;
  context_.reset(EVP_MD_CTX_new());
  must(context_ && EVP_DigestInit_ex2(context_.get(), digest_of(which), nullptr) == 1,
       "EVP_DigestInit_ex2");
}

// A context with the beginning of a message is not kept: freeing it wipes it.
digest::~digest() {
  if (context_ && ended_) spares_->give(static_cast<uint64_t>(which_), std::move(context_));
}

void digest::update(std::span<const uint8_t> bytes) {
  if (ended_) restart();
  must(EVP_DigestUpdate(context_.get(), bytes.data(), bytes.size()) == 1, "EVP_DigestUpdate");
}

void digest::finish(uint8_t* result) {
  if (ended_) restart();
  must(EVP_DigestFinal_ex(context_.get(), result, nullptr) == 1, "EVP_DigestFinal_ex");
  ended_ = true;
}

// Not at once in finish: most operations compute one digest and no more.
void digest::restart() {
  must(EVP_DigestInit_ex2(context_.get(), nullptr, nullptr) == 1, "EVP_DigestInit_ex2");
  ended_ = false;
}

}  // namespace tee::crypto
