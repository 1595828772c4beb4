// RSA and ECDSA in bare libcrypto.
#pragma once

#include <openssl/evp.h>

#include "bench/bare.h"

namespace keymaster::bench {

using pkey_ptr = std::unique_ptr<EVP_PKEY, freed_by<EVP_PKEY_free>>;
using pkey_ctx_ptr = std::unique_ptr<EVP_PKEY_CTX, freed_by<EVP_PKEY_CTX_free>>;
using md_ptr = std::unique_ptr<EVP_MD, freed_by<EVP_MD_free>>;

// rsa_pkey, ec_pkey: the key pair of a blob's key material.
pkey_ptr rsa_pkey(view material);
pkey_ptr ec_pkey(view material);

enum class scheme { PKCS1, PSS, OAEP, ECDSA };  // all with SHA-256
enum class way { SIGN, VERIFY, ENCRYPT, DECRYPT };

// bare_operation: one key, scheme and way, ready to be run over and over.
class bare_operation {
 public:
  bare_operation(EVP_PKEY* key, scheme how, way direction);

  // The result, a signature or text; it lives until the next call. Messages to sign are hashed.
  view run(view input);
  // Throws unless it is the message's signature.
  void verify(view message, view signature);

 private:
  view hash(view message);

  way direction_;
  pkey_ctx_ptr context_;
  uint8_t digest_[EVP_MAX_MD_SIZE];
  uint8_t output_[1024];
};

// take_apart: reads all numbers of a key pair, as storing it takes, and drops them.
void take_apart(EVP_PKEY* key);

// bare_generator: makes key pairs of one kind.
class bare_generator {
 public:
  static bare_generator rsa(unsigned bits);
  static bare_generator ec(const char* curve);
  pkey_ptr run();

 private:
  explicit bare_generator(const char* type);
  pkey_ctx_ptr context_;
};

}  // namespace keymaster::bench
