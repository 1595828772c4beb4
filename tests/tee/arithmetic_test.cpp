// Arithmetic on big integers in the memory of the application.
#include "support.h"

namespace tee::test {
namespace {

class arithmetic : public in_instance {
 protected:
  using number = std::vector<TEE_BigInt>;

  static number of(const bytes& big_endian, int32_t sign = 1, size_t bits = 160) {
    number made(TEE_BigIntSizeInU32(bits));
    TEE_BigIntInit(made.data(), made.size());
    EXPECT_EQ(
        TEE_BigIntConvertFromOctetString(made.data(), big_endian.data(), big_endian.size(), sign),
        TEE_SUCCESS);
    return made;
  }

  // 2^127 - 1, a prime.
  const bytes prime_bytes = [] {
    bytes all(16, 0xFF);
    all[0] = 0x7F;
    return all;
  }();
  const number prime = of(prime_bytes);
};

TEST_F(arithmetic, ResultsAreThoseOfTheNumbers) {
  const bytes power = {0x80, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0};  // 2^127 = 1
  number result = of({});
  TEE_BigIntMod(result.data(), of(power).data(), prime.data());
  EXPECT_EQ(TEE_BigIntCmpS32(result.data(), 1), 0);
  TEE_BigIntMulMod(result.data(), of({0x40, 0, 0, 0, 0, 0, 0, 0}).data(),  // 2^62 2^66 = 2^128 = 2
                   of({4, 0, 0, 0, 0, 0, 0, 0, 0}).data(), prime.data());
  EXPECT_EQ(TEE_BigIntCmpS32(result.data(), 2), 0);
  bytes below = prime_bytes;
  below.back() = 0xFC;
  TEE_BigIntAddMod(result.data(), of(below).data(), of({0, 0, 5}).data(), prime.data());
  EXPECT_EQ(TEE_BigIntCmpS32(result.data(), 2), 0);
}

TEST_F(arithmetic, ComparisonKnowsSigns) {
  const number minus = of({1, 0}, -1), plus = of({1, 0}), zero = of({}, -1);
  EXPECT_EQ(TEE_BigIntCmp(minus.data(), plus.data()), -1);
  EXPECT_EQ(TEE_BigIntCmp(plus.data(), of({0, 0, 1, 0}).data()), 0);
  EXPECT_EQ(TEE_BigIntCmp(prime.data(), plus.data()), 1);
  EXPECT_EQ(TEE_BigIntCmpS32(minus.data(), -256), 0);
  EXPECT_EQ(TEE_BigIntCmpS32(minus.data(), -257), 1);
  EXPECT_EQ(TEE_BigIntCmpS32(minus.data(), INT32_MIN), 1);
  EXPECT_EQ(TEE_BigIntCmpS32(zero.data(), 0), 0);
}

TEST_F(arithmetic, PrimesAreFound) {
  EXPECT_NE(TEE_BigIntIsProbablePrime(prime.data(), 80), 0);
  for (const bytes& composite : {bytes{0}, bytes{1}, bytes{4}, bytes{0x02, 0x31}, bytes{0xFF}}) {
    EXPECT_EQ(TEE_BigIntIsProbablePrime(of(composite).data(), 80), 0);
  }
}

TEST_F(arithmetic, WhatDoesNotFitIsAnOverflow) {
  number narrow(TEE_BigIntSizeInU32(32));
  TEE_BigIntInit(narrow.data(), narrow.size());
  const bytes five(5, 1), four = {0, 0xFF, 0xFF, 0xFF, 0xFF};
  EXPECT_EQ(TEE_BigIntConvertFromOctetString(narrow.data(), five.data(), 5, 1), TEE_ERROR_OVERFLOW);
  EXPECT_EQ(TEE_BigIntConvertFromOctetString(narrow.data(), four.data(), 5, 1), TEE_SUCCESS);
  EXPECT_EQ(TEE_BigIntCmp(narrow.data(), of({0xFF, 0xFF, 0xFF, 0xFF}).data()), 0);
}

}  // namespace
}  // namespace tee::test
