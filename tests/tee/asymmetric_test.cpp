// RSA and ECDSA in what the command-level matrix against libcrypto does not reach: digests of
// any length, results with leading zeros.
#include <algorithm>

#include "support.h"

namespace tee::test {
namespace {

using asymmetric = in_instance;

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

struct curve_row {
  uint32_t curve, bits, algorithm;
};
constexpr curve_row CURVES[] = {{TEE_ECC_CURVE_NIST_P192, 192, TEE_ALG_ECDSA_P192},
                                {TEE_ECC_CURVE_NIST_P224, 224, TEE_ALG_ECDSA_P224},
                                {TEE_ECC_CURVE_NIST_P256, 256, TEE_ALG_ECDSA_P256},
                                {TEE_ECC_CURVE_NIST_P384, 384, TEE_ALG_ECDSA_P384},
                                {TEE_ECC_CURVE_NIST_P521, 521, TEE_ALG_ECDSA_P521}};

// A new key whose numbers were read and populated again, where no cache knows it.
TEE_ObjectHandle new_ec_key(const curve_row& row) {
  const TEE_Attribute curve = value(TEE_ATTR_ECC_CURVE, row.curve);
  TEE_ObjectHandle made = generate(TEE_TYPE_ECDSA_KEYPAIR, row.bits, {curve});
  std::vector<bytes> numbers;
  std::vector<TEE_Attribute> attributes = {curve};
  for (uint32_t id : EC_ATTRIBUTES)
    numbers.push_back(number_of(made, id));
  TEE_FreeTransientObject(made);
  for (size_t i = 0; i < numbers.size(); ++i) {
    EXPECT_EQ(numbers[i].size(), (row.bits + 7) / 8) << "padded to the field";
    attributes.push_back(ref(EC_ATTRIBUTES[i], numbers[i]));
  }
  TEE_Result result = TEE_SUCCESS;
  TEE_ObjectHandle key = populate(TEE_TYPE_ECDSA_KEYPAIR, row.bits, attributes, &result);
  EXPECT_EQ(result, TEE_SUCCESS);
  return key;
}

// Digests of every length are signed; only the leftmost bits of the curve's size count. For 521
// bits, a digest of 66 bytes is a finished number: the same message as one byte more, unshifted.
TEST_F(asymmetric, ecdsa_takes_digests_of_any_length) {
  for (const curve_row& row : CURVES) {
    TEE_ObjectHandle key = new_ec_key(row);
    auto signer = operation(row.algorithm, TEE_MODE_SIGN, row.bits, nullptr);
    auto verifier = operation(row.algorithm, TEE_MODE_VERIFY, row.bits, nullptr);
    for (auto op : {signer, verifier})
      ASSERT_EQ(TEE_SetOperationKey(op, key), TEE_SUCCESS);
    TEE_FreeTransientObject(key);
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

}  // namespace
}  // namespace tee::test
