// What the tests of the adapter share: a platform without extensions behind it, and RSA keys whose
// numbers come from libcrypto.
#pragma once

#include <map>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>

#include "ports/adapter/platform_calls.h"
#include "tee/core/profile.h"
#include "tee/crypto/openssl.h"
#include "tests/tee/support.h"

namespace tee::test {

using crypto::bignum_ptr;
using crypto::pkey_ctx_ptr;
using crypto::pkey_ptr;

class adapter : public in_instance {
 public:
  adapter() { set_profile({.extensions = false}); }
  ~adapter() override {
    set_profile({});
    populate = EITHER_WAY[0];
  }

  // How numbers become a key: by way of the adapter, or of the platform behind it alone.
  static constexpr decltype(&TEE_PopulateTransientObject) EITHER_WAY[] = {
      TEE_PopulateTransientObject, keymaster::adapter::platform_populate};
  static inline auto populate = EITHER_WAY[0];
};

constexpr std::pair<uint32_t, const char*> RSA_NUMBERS[] = {
    {TEE_ATTR_RSA_MODULUS, OSSL_PKEY_PARAM_RSA_N},
    {TEE_ATTR_RSA_PUBLIC_EXPONENT, OSSL_PKEY_PARAM_RSA_E},
    {TEE_ATTR_RSA_PRIVATE_EXPONENT, OSSL_PKEY_PARAM_RSA_D},
    {TEE_ATTR_RSA_PRIME1, OSSL_PKEY_PARAM_RSA_FACTOR1},
    {TEE_ATTR_RSA_PRIME2, OSSL_PKEY_PARAM_RSA_FACTOR2},
    {TEE_ATTR_RSA_EXPONENT1, OSSL_PKEY_PARAM_RSA_EXPONENT1},
    {TEE_ATTR_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_EXPONENT2},
    {TEE_ATTR_RSA_COEFFICIENT, OSSL_PKEY_PARAM_RSA_COEFFICIENT1}};
constexpr size_t N = 0, E = 1, D = 2, P = 3, Q = 4, DP = 5, DQ = 6, QINV = 7;
using numbers = std::vector<bytes>;

inline bytes to_bytes(const BIGNUM* number) {
  bytes result(static_cast<size_t>(BN_num_bytes(number)));
  BN_bn2bin(number, result.data());
  return result;
}

inline bignum_ptr to_bignum(const bytes& number) {
  return bignum_ptr(BN_bin2bn(number.data(), static_cast<int>(number.size()), nullptr));
}

struct rsa_key {
  pkey_ptr pkey;
  numbers all;
};

// key_of: made once a size.
inline const rsa_key& key_of(unsigned bits) {
  static std::map<unsigned, rsa_key> made;
  rsa_key& key = made[bits];
  if (key.pkey == nullptr) {
    key.pkey.reset(EVP_PKEY_Q_keygen(nullptr, nullptr, "RSA", size_t{bits}));
    for (const auto& [id, name] : RSA_NUMBERS) {
      BIGNUM* number = nullptr;
      EXPECT_EQ(EVP_PKEY_get_bn_param(key.pkey.get(), name, &number), 1);
      key.all.push_back(to_bytes(number));
      BN_clear_free(number);
    }
  }
  return key;
}

inline TEE_Result load_rsa(const numbers& all, TEE_ObjectHandle* object) {
  std::vector<TEE_Attribute> attributes;
  for (size_t i = 0; i < all.size(); i++)
    attributes.push_back(ref(RSA_NUMBERS[i].first, all[i]));
  EXPECT_EQ(TEE_AllocateTransientObject(TEE_TYPE_RSA_KEYPAIR, 2048, object), TEE_SUCCESS);
  return adapter::populate(*object, attributes.data(), static_cast<uint32_t>(attributes.size()));
}

inline TEE_OperationHandle rsa_operation(uint32_t algorithm, uint32_t mode, const numbers& key) {
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(load_rsa(key, &object), TEE_SUCCESS);
  return operation(algorithm, mode, 2048, object);
}

}  // namespace tee::test
