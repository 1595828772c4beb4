// Asymmetric keys in libcrypto, the independent party of the tests: it checks what the TA makes and
// makes what the TA checks.
#pragma once

#include <memory>
#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>

#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {

// The scheme of a signature or encryption: KM_PAD_*, KM_DIGEST_*. ECDSA has no padding.
struct scheme {
  uint32_t padding;
  uint32_t digest;
};

// use: what a begin of it asks for.
inline param_set use(scheme how) {
  const param_set params = one(KM_TAG_DIGEST, how.digest);
  return how.padding == 0 ? params : param_set(params).add(KM_TAG_PADDING, how.padding);
}

// pkey: a key pair or public key. Failures of libcrypto throw.
class pkey {
 public:
  // New ones; RSA keys have the exponent 65537.
  static pkey rsa(uint32_t bits);
  static pkey ec(uint32_t bits);
  // What export_key gives: a SubjectPublicKeyInfo; the size in bits and the fields X and Y.
  static pkey rsa_public(byte_view spki);
  static pkey ec_public(byte_view raw);

  // In the form that import_key takes, with some of the numbers (n, e, d, p, q, dP, dQ, qInv or
  // X, Y, d) replaced.
  bytes import_data(const std::map<size_t, bytes>& replaced = {}) const;
  // A number of the key, OSSL_PKEY_PARAM_*, without leading zeros.
  bytes number(const char* name) const;
  size_t size() const { return static_cast<size_t>(EVP_PKEY_get_size(key_.get())); }
  uint32_t bits() const { return static_cast<uint32_t>(EVP_PKEY_get_bits(key_.get())); }

  // Over `message`; with KM_DIGEST_NONE over its bytes as they are. A PSS salt is `salt` bytes
  // long, or as libcrypto's RSA_PSS_SALTLEN_* say.
  bytes sign(scheme how, byte_view message, int salt = RSA_PSS_SALTLEN_AUTO) const;
  bool verify(scheme how, byte_view message, byte_view signature,
              int salt = RSA_PSS_SALTLEN_AUTO) const;

  bytes encrypt(scheme how, byte_view message) const;
  bytes decrypt(scheme how, byte_view message) const;

 private:
  struct closer {
    void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
  };
  explicit pkey(EVP_PKEY* key);

  std::unique_ptr<EVP_PKEY, closer> key_;
};

// right_aligned: `data` with zeros in front, `size` bytes in all.
bytes right_aligned(bytes data, size_t size);

}  // namespace keymaster::test
