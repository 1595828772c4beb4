// Asymmetric keys in libcrypto, the independent party of the tests: it checks what the TA makes and
// makes what the TA checks.
#pragma once

#include <functional>
#include <memory>
#include <openssl/evp.h>

#include "support/ta_under_test.h"

namespace keymaster::test {

// The scheme of a signature or encryption: KM_PAD_*, KM_DIGEST_*. ECDSA has no padding.
struct scheme {
  uint32_t padding;
  uint32_t digest;
};

// pkey: a key pair or public key. Failures of libcrypto throw.
class pkey {
 public:
  // With e = 65537; from two primes in hexadecimal.
  static pkey rsa(const char* p, const char* q);
  // From a SubjectPublicKeyInfo.
  static pkey rsa_public(byte_view spki);
  // From the raw form of an imported or, without the private value, exported key.
  static pkey ec(byte_view raw);

  // RSA: in the form that import_key takes.
  bytes import_data() const;
  // A number of the key, OSSL_PKEY_PARAM_*, without leading zeros.
  bytes number(const char* name) const;
  size_t size() const { return static_cast<size_t>(EVP_PKEY_get_size(key_.get())); }

  // Over `message`; with KM_DIGEST_NONE over its bytes as they are. A PSS salt is `salt` bytes
  // long, or as libcrypto's RSA_PSS_SALTLEN_* say.
  bytes sign(scheme how, byte_view message, int salt = -2) const;
  bool verify(scheme how, byte_view message, byte_view signature, int salt = -2) const;

  bytes encrypt(scheme how, byte_view message) const;
  bytes decrypt(scheme how, byte_view message) const;

 private:
  struct closer {
    void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
  };
  explicit pkey(EVP_PKEY* key);

  std::unique_ptr<EVP_PKEY, closer> key_;
};

// expect_faults_reported: runs `use`, which tells whether all of it was done, failing the first
// call of the platform that can fail, then the second and so on, until none is left to fail.
void expect_faults_reported(const std::function<bool()>& use);

// live_through: imports a key and uses it once, `last` being given to finish; whether all was done.
bool live_through(ta_under_test* ta, const param_set& description, byte_view key_data,
                  uint32_t purpose, const param_set& params, byte_view input, byte_view last);

}  // namespace keymaster::test
