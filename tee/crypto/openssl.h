// Owners of libcrypto's structures, and what happens when libcrypto fails where it must not.
#pragma once

#include <memory>
#include <openssl/bn.h>
#include <openssl/ec.h>
#include <openssl/evp.h>
#include <openssl/param_build.h>
#include <stdexcept>

namespace tee::crypto {

template <auto Free>
struct free_with {
  template <typename T>
  void operator()(T* value) const {
    Free(value);
  }
};

using md_ctx_ptr = std::unique_ptr<EVP_MD_CTX, free_with<EVP_MD_CTX_free>>;
using mac_ctx_ptr = std::unique_ptr<EVP_MAC_CTX, free_with<EVP_MAC_CTX_free>>;
using cipher_ctx_ptr = std::unique_ptr<EVP_CIPHER_CTX, free_with<EVP_CIPHER_CTX_free>>;
using pkey_ptr = std::unique_ptr<EVP_PKEY, free_with<EVP_PKEY_free>>;
using pkey_ctx_ptr = std::unique_ptr<EVP_PKEY_CTX, free_with<EVP_PKEY_CTX_free>>;
using bignum_ptr = std::unique_ptr<BIGNUM, free_with<BN_clear_free>>;
using bn_ctx_ptr = std::unique_ptr<BN_CTX, free_with<BN_CTX_free>>;
using ecdsa_sig_ptr = std::unique_ptr<ECDSA_SIG, free_with<ECDSA_SIG_free>>;

// libcrypto failed although its input was right: out of memory, or an installation without the
// algorithm.
class crypto_failure : public std::runtime_error {
 public:
  // Takes libcrypto's reason from its error queue, and empties the queue.
  explicit crypto_failure(const char* what);
};

// must: throws crypto_failure in the name of `what` unless `success`.
inline void must(bool success, const char* what) {
  if (!success) [[unlikely]]
    throw crypto_failure(what);
}

// forget_errors: empties libcrypto's error queue after a failure that is the caller's business.
void forget_errors();

}  // namespace tee::crypto
