// Numbers that make no key together, as the adapter finds and as the platform behind it finds.
#include "tests/port/support.h"

namespace tee::test {
namespace {

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
    EXPECT_EQ(answer({good[N], {1}, {1}}), TEE_ERROR_BAD_PARAMETERS);  // 1 undoes 1, but is no key
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
