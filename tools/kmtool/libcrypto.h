// Owners of libcrypto's objects.
#pragma once

#include <memory>
#include <openssl/bio.h>
#include <openssl/bn.h>
#include <openssl/decoder.h>
#include <openssl/evp.h>

namespace kmtool {

struct libcrypto_deleter {
  void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
  void operator()(EVP_PKEY_CTX* context) const { EVP_PKEY_CTX_free(context); }
  void operator()(EVP_MD_CTX* context) const { EVP_MD_CTX_free(context); }
  void operator()(OSSL_DECODER_CTX* context) const { OSSL_DECODER_CTX_free(context); }
  void operator()(BIGNUM* number) const { BN_clear_free(number); }
  void operator()(BIO* bio) const { BIO_free(bio); }
};

template <class T>
using owned = std::unique_ptr<T, libcrypto_deleter>;

}  // namespace kmtool
