// The adapter in front of a platform without extensions: every call of a test goes through it, as
// those of a trusted application do. Signatures and keys of the other side come from libcrypto.
#include <functional>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "ports/adapter/platform_calls.h"
#include "tee/core/profile.h"
#include "tee/crypto/openssl.h"
#include "tests/tee/support.h"

namespace tee::test {
namespace {

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

bytes to_bytes(const BIGNUM* number) {
  bytes result(static_cast<size_t>(BN_num_bytes(number)));
  BN_bn2bin(number, result.data());
  return result;
}

bignum_ptr to_bignum(const bytes& number) {
  return bignum_ptr(BN_bin2bn(number.data(), static_cast<int>(number.size()), nullptr));
}

struct rsa_key {
  pkey_ptr pkey;
  numbers all;
};

// Keys are made once a size.
const rsa_key& key_of(unsigned bits) {
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

TEE_Result load_rsa(const numbers& all, TEE_ObjectHandle* object) {
  std::vector<TEE_Attribute> attributes;
  for (size_t i = 0; i < all.size(); i++)
    attributes.push_back(ref(RSA_NUMBERS[i].first, all[i]));
  EXPECT_EQ(TEE_AllocateTransientObject(TEE_TYPE_RSA_KEYPAIR, 2048, object), TEE_SUCCESS);
  return adapter::populate(*object, attributes.data(), static_cast<uint32_t>(attributes.size()));
}

TEE_OperationHandle rsa_operation(uint32_t algorithm, uint32_t mode, const numbers& key) {
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(load_rsa(key, &object), TEE_SUCCESS);
  return operation(algorithm, mode, 2048, object);
}

struct pss_digest {
  uint32_t algorithm;
  const EVP_MD* digest;
  size_t size;
};
const pss_digest PSS_DIGESTS[] = {{TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, EVP_sha1(), 20},
                                  {TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224, EVP_sha224(), 28},
                                  {TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, EVP_sha256(), 32},
                                  {TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384, EVP_sha384(), 48},
                                  {TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512, EVP_sha512(), 64}};
// The block is one byte shorter than a modulus of 1025 bits; 1023 and 1030 leave bits of its first.
constexpr unsigned PSS_SIZES[] = {1023, 1024, 1025, 1030};

pkey_ctx_ptr pss_context(const rsa_key& key, const pss_digest& row, bool sign, int salt_length) {
  pkey_ctx_ptr context(EVP_PKEY_CTX_new(key.pkey.get(), nullptr));
  EXPECT_EQ(sign ? EVP_PKEY_sign_init(context.get()) : EVP_PKEY_verify_init(context.get()), 1);
  EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PSS_PADDING), 1);
  EXPECT_EQ(EVP_PKEY_CTX_set_signature_md(context.get(), row.digest), 1);
  EXPECT_EQ(EVP_PKEY_CTX_set_rsa_pss_saltlen(context.get(), salt_length), 1);
  return context;
}

TEE_Result verify(TEE_OperationHandle op, const bytes& hash, const bytes& signature) {
  TEE_Attribute any{};
  TEE_InitValueAttribute(&any, TEE_ATTR_RSA_PSS_SALT_LENGTH, TEE_PSS_SALT_MAX_LENGTH, 0);
  return TEE_AsymmetricVerifyDigest(op, &any, 1, hash.data(), hash.size(), signature.data(),
                                    signature.size());
}

TEST_F(adapter, PssVerifiesWithASaltOfAnyLength) {
  for (unsigned bits : PSS_SIZES) {
    for (const pss_digest& row : PSS_DIGESTS) {
      SCOPED_TRACE(std::to_string(bits) + " bits, digest of " + std::to_string(row.size));
      const rsa_key& key = key_of(bits);
      const auto op = rsa_operation(row.algorithm, TEE_MODE_VERIFY, key.all);
      const bytes hash(row.size, 0x5A);
      const int longest = static_cast<int>((bits + 6) / 8 - row.size - 2);
      for (int salt : {0, 1, std::min(longest, 20), longest}) {
        bytes signature((bits + 7) / 8);
        size_t size = signature.size();
        ASSERT_EQ(EVP_PKEY_sign(pss_context(key, row, true, salt).get(), signature.data(), &size,
                                hash.data(), hash.size()),
                  1);
        EXPECT_EQ(verify(op, hash, signature), TEE_SUCCESS) << "salt of " << salt;
        EXPECT_EQ(verify(op, bytes(row.size, 0x5B), signature), TEE_ERROR_SIGNATURE_INVALID);
        signature.push_back(0);
        EXPECT_EQ(verify(op, hash, signature), TEE_ERROR_SIGNATURE_INVALID);
      }
      TEE_FreeOperation(op);
    }
  }
}

TEST_F(adapter, PssSignsWithTheLengthThatACodeStandsFor) {
  for (unsigned bits : PSS_SIZES) {
    for (const pss_digest& row : PSS_DIGESTS) {
      const rsa_key& key = key_of(bits);
      const auto longest = static_cast<uint32_t>((bits + 6) / 8 - row.size - 2);
      const auto digest = static_cast<uint32_t>(row.size);
      // Sent as a code, or as a length; what libcrypto must find.
      for (auto [code, length] : {std::pair{TEE_PSS_SALT_DIGEST_LENGTH, std::min(digest, longest)},
                                  {TEE_PSS_SALT_MAX_LENGTH, longest},
                                  {7u, 7u},
                                  {0u, 0u}}) {
        SCOPED_TRACE(std::to_string(bits) + " bits, code " + std::to_string(code));
        const auto op = rsa_operation(row.algorithm, TEE_MODE_SIGN, key.all);
        TEE_Attribute salt{};
        TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, code, 0);
        const bytes hash(row.size, 0x77);
        bytes signature((bits + 7) / 8);
        size_t size = signature.size();
        ASSERT_EQ(TEE_AsymmetricSignDigest(op, &salt, 1, hash.data(), hash.size(), signature.data(),
                                           &size),
                  TEE_SUCCESS);
        EXPECT_EQ(EVP_PKEY_verify(pss_context(key, row, false, static_cast<int>(length)).get(),
                                  signature.data(), size, hash.data(), hash.size()),
                  1);
        TEE_FreeOperation(op);
      }
    }
  }
}

// What the private operation makes of a block.
bytes sign_block(const rsa_key& key, const bytes& block) {
  pkey_ctx_ptr context(EVP_PKEY_CTX_new(key.pkey.get(), nullptr));
  EVP_PKEY_decrypt_init(context.get());
  EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_NO_PADDING);
  bytes result(block.size());
  size_t size = result.size();
  EXPECT_EQ(EVP_PKEY_decrypt(context.get(), result.data(), &size, block.data(), block.size()), 1);
  return result;
}

// A block as EMSA-PSS makes it under SHA-256, but for what `spoil` does to its data before masking.
bytes pss_block(const bytes& hash, size_t size, size_t salt_length,
                const std::function<void(bytes* data)>& spoil) {
  const auto sha256 = [](const bytes& data) {
    bytes digest(32);
    EVP_Digest(data.data(), data.size(), digest.data(), nullptr, EVP_sha256(), nullptr);
    return digest;
  };
  bytes data(size - 33, 0);
  std::fill(data.end() - static_cast<ptrdiff_t>(salt_length), data.end(), 0xAB);
  data[data.size() - salt_length - 1] = 1;
  bytes salted(8, 0);
  salted.insert(salted.end(), hash.begin(), hash.end());
  salted.insert(salted.end(), salt_length, 0xAB);
  const bytes seed = sha256(salted);
  spoil(&data);
  for (size_t i = 0; i < data.size(); i++) {
    bytes input = seed;
    for (unsigned shift : {24, 16, 8, 0})
      input.push_back(static_cast<uint8_t>(i / 32 >> shift));
    data[i] ^= sha256(input)[i % 32];
  }
  data.front() &= 0x7F;
  data.insert(data.end(), seed.begin(), seed.end());
  data.push_back(0xBC);
  return data;
}

TEST_F(adapter, PssBlocksOfAnotherFormAreRefused) {
  const rsa_key& key = key_of(1024);
  const auto op = rsa_operation(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, TEE_MODE_VERIFY, key.all);
  const bytes hash(32, 0x11);
  const auto answer = [&](const std::function<void(bytes*)>& spoil,
                          const std::function<void(bytes*)>& spoil_masked) {
    bytes block = pss_block(hash, 128, 10, spoil);
    spoil_masked(&block);
    return verify(op, hash, sign_block(key, block));
  };
  const auto kept = [](bytes*) {};
  EXPECT_EQ(answer(kept, kept), TEE_SUCCESS);
  const std::function<void(bytes*)> data_faults[] = {
      [](bytes* data) { data->at(1) = 1; },                           // another separator
      [](bytes* data) { data->at(data->size() - 11) = 2; },           // a wrong one
      [](bytes* data) { data->at(data->size() - 11) = 0; },           // none before the salt
      [](bytes* data) { std::fill(data->begin(), data->end(), 0); },  // none at all
      [](bytes* data) { data->back() ^= 1; },                         // another salt
  };
  for (const auto& spoil : data_faults)
    EXPECT_EQ(answer(spoil, kept), TEE_ERROR_SIGNATURE_INVALID);
  const std::function<void(bytes*)> block_faults[] = {
      [](bytes* block) { block->back() = 0xBD; },      // another trailer
      [](bytes* block) { block->at(127 - 32) ^= 1; },  // another digest
      [](bytes* block) { block->at(127 - 1) ^= 0x80; },
      [](bytes* block) { block->front() |= 0x80; },  // a bit above the block's
  };
  for (const auto& spoil : block_faults) {
    bytes block = pss_block(hash, 128, 10, kept);
    spoil(&block);
    if (BN_cmp(to_bignum(block).get(), to_bignum(key.all[N]).get()) >= 0) continue;
    EXPECT_EQ(answer(kept, spoil), TEE_ERROR_SIGNATURE_INVALID);
  }
  const bytes above = key.all[N];
  EXPECT_EQ(verify(op, hash, above), TEE_ERROR_SIGNATURE_INVALID);
  TEE_FreeOperation(op);
}

TEST_F(adapter, ExportsThePublicKey) {
  for (unsigned bits : {512u, 1024u, 1030u, 2048u}) {
    const rsa_key& key = key_of(bits);
    TEE_OperationHandle op = nullptr;
    ASSERT_EQ(TEE_AllocateOperation(&op, TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, 0), TEE_SUCCESS);
    TEE_ObjectHandle object = nullptr;
    ASSERT_EQ(load_rsa(key.all, &object), TEE_SUCCESS);
    ASSERT_EQ(TEE_SetOperationKey(op, object), TEE_SUCCESS);
    TEE_FreeTransientObject(object);  // the operation remembers
    unsigned char* expected = nullptr;
    const int length = i2d_PUBKEY(key.pkey.get(), &expected);
    size_t size = 0;
    EXPECT_EQ(TEE_AsymmetricExport(op, TEE_EXPORT_FORMAT_SPKI, nullptr, &size),
              TEE_ERROR_SHORT_BUFFER);
    bytes der(size);
    EXPECT_EQ(TEE_AsymmetricExport(op, TEE_EXPORT_FORMAT_SPKI, der.data(), &size), TEE_SUCCESS);
    EXPECT_EQ(der, bytes(expected, expected + length));
    EXPECT_EQ(TEE_AsymmetricExport(op, 4, der.data(), &size), TEE_ERROR_NOT_SUPPORTED);
    OPENSSL_free(expected);
    TEE_FreeOperation(op);
  }
}

TEST_F(adapter, RawResultsHaveNoLeadingZeros) {
  const rsa_key& key = key_of(1024);
  const auto encryption = rsa_operation(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, key.all);
  const auto decryption = rsa_operation(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, key.all);
  for (const bytes& number : {bytes{0}, bytes{1}, bytes{5, 6, 7}}) {
    bytes hidden(128), found(128);
    size_t size = hidden.size();
    ASSERT_EQ(TEE_AsymmetricEncrypt(encryption, nullptr, 0, number.data(), number.size(),
                                    hidden.data(), &size),
              TEE_SUCCESS);
    size_t found_size = found.size();
    ASSERT_EQ(TEE_AsymmetricDecrypt(decryption, nullptr, 0, hidden.data(), size, found.data(),
                                    &found_size),
              TEE_SUCCESS);
    found.resize(found_size);
    EXPECT_EQ(found, number);
  }
  TEE_FreeOperation(encryption);
  TEE_FreeOperation(decryption);
}

// A key of three primes whose first two pass for one: all its numbers agree.
numbers three_primes() {
  numbers key = key_of(1024).all;
  const crypto::bn_ctx_ptr scratch(BN_CTX_new());
  bignum_ptr first = to_bignum(key_of(512).all[P]), composite(BN_new()), order(BN_new()),
             inverse(BN_new()), q(to_bignum(key[Q])), n(BN_new()), e(to_bignum(key[E]));
  // p = first second, until e has an inverse modulo p - 1.
  BN_mul(composite.get(), first.get(), to_bignum(key_of(512).all[Q]).get(), scratch.get());
  BN_sub(order.get(), composite.get(), BN_value_one());
  BN_mod_inverse(inverse.get(), e.get(), order.get(), scratch.get());
  key[P] = to_bytes(composite.get());
  key[DP] = to_bytes(inverse.get());
  BN_mul(n.get(), composite.get(), q.get(), scratch.get());
  key[N] = to_bytes(n.get());
  BN_mod_inverse(inverse.get(), q.get(), composite.get(), scratch.get());
  key[QINV] = to_bytes(inverse.get());
  // d from both exponents: by way of (p - 1)(q - 1).
  bignum_ptr order_q(BN_dup(q.get())), whole(BN_new());
  BN_sub_word(order_q.get(), 1);
  BN_mul(whole.get(), order.get(), order_q.get(), scratch.get());
  BN_mod_inverse(inverse.get(), e.get(), whole.get(), scratch.get());
  key[D] = to_bytes(inverse.get());
  return key;
}

TEE_Result answer(const numbers& key) {
  TEE_ObjectHandle object = nullptr;
  const TEE_Result res = load_rsa(key, &object);
  TEE_FreeTransientObject(object);
  return res;
}

TEST_F(adapter, RsaNumbersThatAreTooLargeAreRefusedThoughTheyAgree) {
  const numbers& good = key_of(1030).all;
  const auto plus = [&](size_t which, size_t times, const bytes& period) {
    numbers key = good;
    bignum_ptr sum = to_bignum(key[which]);
    for (size_t i = 0; i < times; i++)
      BN_add(sum.get(), sum.get(), to_bignum(period).get());
    key[which] = to_bytes(sum.get());
    return key;
  };
  const auto less_one = [](const bytes& prime) {
    bignum_ptr order = to_bignum(prime);
    BN_sub_word(order.get(), 1);
    return to_bytes(order.get());
  };
  const crypto::bn_ctx_ptr scratch(BN_CTX_new());
  bignum_ptr product(BN_new());
  BN_mul(product.get(), to_bignum(less_one(good[P])).get(), to_bignum(less_one(good[Q])).get(),
         scratch.get());
  const bytes order = to_bytes(product.get());
  for (const auto way : EITHER_WAY) {
    populate = way;
    for (const size_t count : {3, 8}) {
      for (numbers key : {plus(E, 2, order), plus(D, 2, order), plus(E, 1, good[N])}) {
        key.resize(count);
        EXPECT_EQ(answer(key), TEE_ERROR_BAD_PARAMETERS) << count;
      }
    }
    for (const numbers& key :
         {plus(DP, 1, less_one(good[P])), plus(DQ, 1, less_one(good[Q])), plus(QINV, 1, good[P])}) {
      EXPECT_EQ(answer(key), TEE_ERROR_BAD_PARAMETERS);
    }
  }
}

TEST_F(adapter, RsaNumbersThatDoNotBelongTogetherAreRefused) {
  const numbers& good = key_of(1024).all;
  const auto changed = [&](size_t which, const bytes& number) {
    numbers key = good;
    key[which] = number;
    return key;
  };
  const auto plus_two = [](bytes number) {
    bignum_ptr value = to_bignum(number);
    BN_add_word(value.get(), 2);
    return to_bytes(value.get());
  };
  EXPECT_EQ(answer(three_primes()), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(answer({good[N], good[E], good[D], {}, {}, {}, {}, {}}), TEE_ERROR_BAD_PARAMETERS);
  for (const auto way : EITHER_WAY) {
    populate = way;
    EXPECT_EQ(answer(good), TEE_SUCCESS);
    EXPECT_EQ(answer(good), TEE_SUCCESS);  // remembered
    EXPECT_EQ(answer(numbers(good.begin(), good.begin() + 3)), TEE_SUCCESS);
    EXPECT_EQ(answer({good[N], good[E], good[D], good[P], good[Q], {}, {}, {}}),
              TEE_ERROR_BAD_PARAMETERS);
    for (size_t which : {N, E, D, P, Q, DP, DQ, QINV}) {
      SCOPED_TRACE(which);
      bytes wide = good[which];
      wide.insert(wide.begin(), 3, 0);
      if (which != N) {
        EXPECT_EQ(answer(changed(which, wide)), TEE_SUCCESS);
      }
      EXPECT_EQ(answer(changed(which, plus_two(good[which]))), TEE_ERROR_BAD_PARAMETERS);
      for (const bytes& number : {bytes{}, bytes{0}, bytes{1}, bytes{2}, good[N]}) {
        if (number == good[which]) continue;
        numbers key = changed(which, number);
        EXPECT_EQ(answer(key), TEE_ERROR_BAD_PARAMETERS);
        key.resize(3);
        EXPECT_EQ(answer(key), which > D ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS);
      }
    }
  }
}

struct ec_case {
  uint32_t curve;
  uint32_t bits;
  const char* group;
};
constexpr ec_case EC_CURVES[] = {{TEE_ECC_CURVE_NIST_P192, 192, "P-192"},
                                 {TEE_ECC_CURVE_NIST_P224, 224, "P-224"},
                                 {TEE_ECC_CURVE_NIST_P256, 256, "P-256"},
                                 {TEE_ECC_CURVE_NIST_P384, 384, "P-384"},
                                 {TEE_ECC_CURVE_NIST_P521, 521, "P-521"}};

struct ec_numbers {
  bytes x, y, secret;
};

ec_numbers ec_key_of(const char* group) {
  const pkey_ptr pkey(EVP_PKEY_Q_keygen(nullptr, nullptr, "EC", group));
  const auto number = [&](const char* name) {
    BIGNUM* value = nullptr;
    EXPECT_EQ(EVP_PKEY_get_bn_param(pkey.get(), name, &value), 1);
    const bignum_ptr owner(value);
    return to_bytes(value);
  };
  return {number(OSSL_PKEY_PARAM_EC_PUB_X), number(OSSL_PKEY_PARAM_EC_PUB_Y),
          number(OSSL_PKEY_PARAM_PRIV_KEY)};
}

TEST_F(adapter, EcNumbersThatDoNotBelongTogetherAreRefused) {
  for (size_t i = 0; i < 2 * std::size(EC_CURVES); i++) {
    populate = EITHER_WAY[i % 2];
    const ec_case& row = EC_CURVES[i / 2];
    SCOPED_TRACE(row.group);
    const auto answer = [&](const ec_numbers& key) {
      TEE_Attribute curve{};
      TEE_InitValueAttribute(&curve, TEE_ATTR_ECC_CURVE, row.curve, 0);
      const TEE_Attribute attributes[] = {ref(TEE_ATTR_ECC_PUBLIC_VALUE_X, key.x),
                                          ref(TEE_ATTR_ECC_PUBLIC_VALUE_Y, key.y),
                                          ref(TEE_ATTR_ECC_PRIVATE_VALUE, key.secret), curve};
      TEE_ObjectHandle object = nullptr;
      EXPECT_EQ(TEE_AllocateTransientObject(TEE_TYPE_ECDSA_KEYPAIR, row.bits, &object),
                TEE_SUCCESS);
      const TEE_Result res = populate(object, attributes, 4);
      TEE_FreeTransientObject(object);
      return res;
    };
    const ec_numbers good = ec_key_of(row.group), other = ec_key_of(row.group);
    EXPECT_EQ(answer(good), TEE_SUCCESS);
    EXPECT_EQ(answer({other.x, other.y, other.secret}), TEE_SUCCESS);
    bytes x = good.x, y = good.y;
    x.back() ^= 1;
    y.back() ^= 1;
    for (const ec_numbers& bad : {ec_numbers{x, good.y, good.secret},
                                  {good.x, y, good.secret},
                                  {good.x, good.y, other.secret},
                                  {other.x, other.y, good.secret},
                                  {good.x, good.y, {}},
                                  {good.x, good.y, {0}},
                                  {good.x, good.y, {1}},
                                  {{}, {}, good.secret},
                                  {good.x, good.y, bytes((row.bits + 7) / 8, 0xFF)},
                                  {bytes((row.bits + 7) / 8, 0xFF), good.y, good.secret}}) {
      EXPECT_EQ(answer(bad), TEE_ERROR_BAD_PARAMETERS);
    }
  }
}

}  // namespace
}  // namespace tee::test
