// RSA and ECDSA in what the command-level matrix against libcrypto does not reach: what keys are
// taken and made, digests of any length, results with leading zeros.
#include <algorithm>

#include "support.h"

namespace tee::test {
namespace {

using asymmetric = in_instance;
using asymmetric_death = in_instance;

constexpr uint32_t RSA_ATTRIBUTES[] = {TEE_ATTR_RSA_MODULUS,          TEE_ATTR_RSA_PUBLIC_EXPONENT,
                                       TEE_ATTR_RSA_PRIVATE_EXPONENT, TEE_ATTR_RSA_PRIME1,
                                       TEE_ATTR_RSA_PRIME2,           TEE_ATTR_RSA_EXPONENT1,
                                       TEE_ATTR_RSA_EXPONENT2,        TEE_ATTR_RSA_COEFFICIENT};
constexpr uint32_t EC_ATTRIBUTES[] = {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                      TEE_ATTR_ECC_PRIVATE_VALUE};

TEE_ObjectHandle generate(uint32_t type, uint32_t bits, const std::vector<TEE_Attribute>& params,
                          TEE_Result expected = TEE_SUCCESS) {
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &object), TEE_SUCCESS);
  EXPECT_EQ(TEE_GenerateKey(object, bits, params.data(), static_cast<uint32_t>(params.size())),
            expected);
  return object;
}

bytes number_of(TEE_ObjectHandle object, uint32_t id) {
  bytes number(1024);
  size_t length = number.size();
  EXPECT_EQ(TEE_GetObjectBufferAttribute(object, id, number.data(), &length), TEE_SUCCESS);
  number.resize(length);
  return number;
}

std::vector<bytes> numbers_of(TEE_ObjectHandle object, std::span<const uint32_t> ids) {
  std::vector<bytes> numbers;
  for (uint32_t id : ids)
    numbers.push_back(number_of(object, id));
  return numbers;
}

bytes joined(const bytes& first, const bytes& second) {
  bytes result = first;
  result.insert(result.end(), second.begin(), second.end());
  return result;
}

bytes sign(TEE_OperationHandle op, const bytes& digest) {
  size_t length = 0;
  EXPECT_EQ(
      TEE_AsymmetricSignDigest(op, nullptr, 0, digest.data(), digest.size(), nullptr, &length),
      TEE_ERROR_SHORT_BUFFER);
  bytes signature(length);
  EXPECT_EQ(TEE_AsymmetricSignDigest(op, nullptr, 0, digest.data(), digest.size(), signature.data(),
                                     &length),
            TEE_SUCCESS);
  return signature;
}

TEE_Result verify(TEE_OperationHandle op, const bytes& digest, const bytes& signature) {
  return TEE_AsymmetricVerifyDigest(op, nullptr, 0, digest.data(), digest.size(), signature.data(),
                                    signature.size());
}

// A signature is as long as the modulus (RFC 8017, 8.1.2): without its leading zero, the same
// number is none. One in 256 begins with a zero.
TEST_F(asymmetric, rsa_signatures_keep_their_leading_zero) {
  TEE_ObjectHandle key = generate(TEE_TYPE_RSA_KEYPAIR, 520, {});
  auto signer = operation(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, TEE_MODE_SIGN, 520, nullptr);
  auto verifier = operation(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, TEE_MODE_VERIFY, 520, nullptr);
  ASSERT_EQ(TEE_SetOperationKey(signer, key), TEE_SUCCESS);
  ASSERT_EQ(TEE_SetOperationKey(verifier, key), TEE_SUCCESS);
  TEE_FreeTransientObject(key);
  const bytes digest(20, 7);
  bytes signature{1};
  for (int tries = 0; tries < 10000 && signature[0] != 0; ++tries)
    signature = sign(signer, digest);
  EXPECT_EQ(verify(verifier, digest, signature), TEE_SUCCESS);
  signature.erase(signature.begin());
  EXPECT_EQ(verify(verifier, digest, signature), TEE_ERROR_SIGNATURE_INVALID);
  TEE_FreeOperation(signer);
  TEE_FreeOperation(verifier);
}

// One number of the key changed; `count` numbers given.
TEST_F(asymmetric, rsa_keys_are_checked_when_populated) {
  constexpr uint32_t BITS = 1024;
  constexpr size_t LENGTH = BITS / 8;
  TEE_ObjectHandle made = generate(TEE_TYPE_RSA_KEYPAIR, BITS, {});
  const std::vector<bytes> good = numbers_of(made, RSA_ATTRIBUTES);
  TEE_FreeTransientObject(made);
  const auto with_zeros = [&](size_t index) { return joined(bytes(3), good[index]); };
  bytes even = good[0];
  even.back() &= 0xFE;
  const struct {
    size_t changed;
    bytes number;
    size_t count;
    bool taken;
  } rows[] = {
      {0, good[0], 8, true},
      {0, good[0], 3, true},
      {0, with_zeros(0), 8, true},
      {2, with_zeros(2), 3, true},
      {7, with_zeros(7), 8, true},
      {0, even, 3, false},
      {0, {}, 3, false},
      {0, bytes(LENGTH), 3, false},
      {0, bytes(60, 0xFF), 3, false},
      {1, {1}, 3, false},
      {0, bytes(129, 0xFF), 3, false},
      {1, {2}, 3, false},
      {1, {3}, 3, false},
      {1, {3}, 8, false},
      {1, good[0], 3, false},
      {2, {5}, 3, false},
      {2, {}, 8, false},
      {2, bytes(256, 255), 3, false},
      {3, good[4], 8, false},
      {3, {}, 8, false},
      {3, {1}, 8, false},
      {5, good[6], 8, false},
      {7, {1}, 8, false},
      {6, good[6], 7, false},
  };
  for (const auto& row : rows) {
    std::vector<bytes> numbers = good;
    numbers[row.changed] = row.number;
    std::vector<TEE_Attribute> attributes;
    for (size_t i = 0; i < row.count; ++i)
      attributes.push_back(ref(RSA_ATTRIBUTES[i], numbers[i]));
    TEE_Result result = TEE_SUCCESS;
    TEE_ObjectHandle key = populate(TEE_TYPE_RSA_KEYPAIR, BITS, attributes, &result);
    EXPECT_EQ(result, row.taken ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS)
        << row.changed << " of " << row.count;
    TEE_ObjectInfo info;
    ASSERT_EQ(TEE_GetObjectInfo1(key, &info), TEE_SUCCESS);
    EXPECT_EQ(info.objectSize, row.taken ? BITS : 0);
    TEE_FreeTransientObject(key);
  }
}

TEST_F(asymmetric, rsa_keys_have_the_size_and_exponent_asked_for) {
  const struct {
    uint32_t bits;
    bytes exponent, kept;
    TEE_Result result;
  } rows[] = {
      {512, {}, hex("010001"), TEE_SUCCESS},
      {520, hex("0000000000010001"), hex("010001"), TEE_SUCCESS},
      {1024, hex("8000000000000003"), hex("8000000000000003"), TEE_SUCCESS},
      {512, hex("0000000000000001"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("0000000000010000"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("00"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("010000000000000001"), {}, TEE_ERROR_BAD_PARAMETERS},
  };
  for (const auto& row : rows) {
    std::vector<TEE_Attribute> params;
    if (!row.exponent.empty()) params.push_back(ref(TEE_ATTR_RSA_PUBLIC_EXPONENT, row.exponent));
    TEE_ObjectHandle key = generate(TEE_TYPE_RSA_KEYPAIR, row.bits, params, row.result);
    if (row.result == TEE_SUCCESS) {
      const bytes modulus = number_of(key, TEE_ATTR_RSA_MODULUS);
      EXPECT_EQ(modulus.size(), row.bits / 8);
      EXPECT_GE(modulus[0], 0x80);
      EXPECT_EQ(number_of(key, TEE_ATTR_RSA_PUBLIC_EXPONENT), row.kept);
      auto op = operation(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, 0, key);
      size_t length = 0;
      EXPECT_EQ(TEE_AsymmetricExport(op, 4, nullptr, &length), TEE_ERROR_NOT_SUPPORTED);
      TEE_FreeOperation(op);
      continue;
    }
    TEE_FreeTransientObject(key);
  }
}

struct curve_row {
  uint32_t curve, bits, algorithm;
};
constexpr curve_row CURVES[] = {{TEE_ECC_CURVE_NIST_P192, 192, TEE_ALG_ECDSA_P192},
                                {TEE_ECC_CURVE_NIST_P224, 224, TEE_ALG_ECDSA_P224},
                                {TEE_ECC_CURVE_NIST_P256, 256, TEE_ALG_ECDSA_P256},
                                {TEE_ECC_CURVE_NIST_P384, 384, TEE_ALG_ECDSA_P384},
                                {TEE_ECC_CURVE_NIST_P521, 521, TEE_ALG_ECDSA_P521}};

std::vector<bytes> new_ec_numbers(const curve_row& row) {
  TEE_ObjectHandle made =
      generate(TEE_TYPE_ECDSA_KEYPAIR, row.bits, {value(TEE_ATTR_ECC_CURVE, row.curve)});
  const std::vector<bytes> numbers = numbers_of(made, EC_ATTRIBUTES);
  for (const bytes& number : numbers)
    EXPECT_EQ(number.size(), (row.bits + 7) / 8) << "padded to the field";
  TEE_FreeTransientObject(made);
  return numbers;
}

TEE_ObjectHandle ec_key(const curve_row& row, const std::vector<bytes>& numbers, TEE_Result* result,
                        uint32_t curve) {
  std::vector<TEE_Attribute> attributes = {value(TEE_ATTR_ECC_CURVE, curve)};
  for (size_t i = 0; i < std::size(EC_ATTRIBUTES); ++i)
    attributes.push_back(ref(EC_ATTRIBUTES[i], numbers[i]));
  return populate(TEE_TYPE_ECDSA_KEYPAIR, row.bits, attributes, result);
}

TEST_F(asymmetric, ec_keys_are_checked_when_made_and_populated) {
  for (const curve_row& row : CURVES) {
    const uint32_t other_curve = row.curve % 5 + 1;
    TEE_FreeTransientObject(generate(TEE_TYPE_ECDSA_KEYPAIR, row.bits,
                                     {value(TEE_ATTR_ECC_CURVE, other_curve)},
                                     TEE_ERROR_BAD_PARAMETERS));
    TEE_FreeTransientObject(
        generate(TEE_TYPE_ECDSA_KEYPAIR, row.bits, {}, TEE_ERROR_BAD_PARAMETERS));
    const std::vector<bytes> good = new_ec_numbers(row);
    const bytes &x = good[0], &y = good[1], &d = good[2];
    const bytes none(d.size());
    const bytes most(d.size(), 0xFF);
    bytes other = d;
    other.back() ^= 1;
    const struct {
      std::vector<bytes> numbers;
      uint32_t curve;
      bool taken;
    } rows[] = {
        {{x, y, d}, row.curve, true},        {{joined(bytes(5), x), y, d}, row.curve, true},
        {{x, y, other}, row.curve, false},   {{x, y, none}, row.curve, false},
        {{x, y, most}, row.curve, false},    {{y, x, d}, row.curve, false},
        {{none, none, d}, row.curve, false}, {{joined(most, x), y, d}, row.curve, false},
        {{x, y, d}, other_curve, false},
    };
    instance fresh(UUID, shared_device(), HEAP_LIMIT);  // whose key cache is empty
    instance_scope inside(fresh);
    for (const auto& change : rows) {
      TEE_Result result = TEE_SUCCESS;
      TEE_FreeTransientObject(ec_key(row, change.numbers, &result, change.curve));
      EXPECT_EQ(result, change.taken ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS)
          << row.bits << ", row " << &change - rows;
    }
  }
}

// Digests of every length are signed; only the leftmost bits of the curve's size count. For 521
// bits, a digest of 66 bytes is a finished number: the same message as one byte more, unshifted.
TEST_F(asymmetric, ecdsa_takes_digests_of_any_length) {
  for (const curve_row& row : CURVES) {
    const std::vector<bytes> numbers = new_ec_numbers(row);
    TEE_Result result = TEE_SUCCESS;
    const auto begin = [&](uint32_t mode) {
      return operation(row.algorithm, mode, row.bits, ec_key(row, numbers, &result, row.curve));
    };
    auto signer = begin(TEE_MODE_SIGN);
    auto verifier = begin(TEE_MODE_VERIFY);
    for (size_t length : {0, 1, 20, 24, 28, 32, 48, 64, 65, 66, 67, 100}) {
      bytes digest(length, 0xC3);
      if (length == 66) digest[0] = 1;
      bytes signature = sign(signer, digest);
      EXPECT_EQ(signature.size(), (row.bits + 7) / 8 * 2);
      EXPECT_EQ(verify(verifier, digest, signature), TEE_SUCCESS) << row.bits << " " << length;
      if (length > 0) {
        digest.back() ^= 0xFF;
        const bool counts = length * 8 <= std::max(row.bits, row.bits == 521 ? 528U : 0U);
        EXPECT_EQ(verify(verifier, digest, signature) != TEE_SUCCESS, counts) << length;
        digest.back() ^= 0xFF;
      }
      signature[length % signature.size()] ^= 0x40;
      EXPECT_EQ(verify(verifier, digest, signature), TEE_ERROR_SIGNATURE_INVALID);
      for (const bytes& bad : {bytes(), bytes(signature.size()), bytes(signature.size(), 0xFF),
                               bytes(signature.size() + 1, 1)}) {
        EXPECT_EQ(verify(verifier, digest, bad), TEE_ERROR_SIGNATURE_INVALID);
      }
    }
    if (row.bits == 521) {
      const bytes digest(67, 0xC3);
      bytes number(66);
      for (size_t i = 0; i < number.size(); ++i)
        number[i] = static_cast<uint8_t>((i > 0 ? digest[i - 1] << 1 : 0) | digest[i] >> 7);
      EXPECT_EQ(verify(verifier, digest, sign(signer, number)), TEE_SUCCESS);
    }
    TEE_FreeOperation(signer);
    TEE_FreeOperation(verifier);
  }
}

TEST_F(asymmetric_death, digests_of_another_length_panic) {
  auto op = operation(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN, 512,
                      generate(TEE_TYPE_RSA_KEYPAIR, 512, {}));
  uint8_t out[64];
  size_t length = sizeof(out);
  EXPECT_DEATH(TEE_AsymmetricSignDigest(op, nullptr, 0, out, 31, out, &length),
               "panic: TEE_AsymmetricSignDigest: a digest of 31 bytes, not 32");
}

}  // namespace
}  // namespace tee::test
