// RSA and ECDSA in what the command-level matrix against libcrypto does not reach: digests of any
// length, signatures with a leading zero.
#include <algorithm>
#include <array>

#include "support.h"

namespace tee::test {
namespace {

using asymmetric = in_instance;

// Operations that sign and verify with a new key.
std::array<TEE_OperationHandle, 2> on_new_key(uint32_t type, uint32_t bits, uint32_t algorithm,
                                              const std::vector<TEE_Attribute>& params) {
  TEE_ObjectHandle key = nullptr;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &key), TEE_SUCCESS);
  EXPECT_EQ(TEE_GenerateKey(key, bits, params.data(), static_cast<uint32_t>(params.size())),
            TEE_SUCCESS);
  std::array ops = {operation(algorithm, TEE_MODE_SIGN, bits, nullptr),
                    operation(algorithm, TEE_MODE_VERIFY, bits, nullptr)};
  for (auto op : ops)
    EXPECT_EQ(TEE_SetOperationKey(op, key), TEE_SUCCESS);
  TEE_FreeTransientObject(key);
  return ops;
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
  auto [signer, verifier] =
      on_new_key(TEE_TYPE_RSA_KEYPAIR, 520, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, {});
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

// Digests of every length are signed; only the leftmost bits of the curve's size count. For 521
// bits, a digest of 66 bytes is a finished number, of which all count.
TEST_F(asymmetric, ecdsa_takes_digests_of_any_length) {
  for (const curve_row& row : CURVES) {
    TEE_Attribute curve;
    TEE_InitValueAttribute(&curve, TEE_ATTR_ECC_CURVE, row.curve, 0);
    auto [signer, verifier] = on_new_key(TEE_TYPE_ECDSA_KEYPAIR, row.bits, row.algorithm, {curve});
    for (size_t length : {0, 1, 24, 28, 32, 48, 65, 66, 67}) {
      bytes digest(length, 0xC3);
      if (length == 66) digest[0] = 1;
      bytes signature = sign(signer, digest);
      EXPECT_EQ(signature.size(), (row.bits + 7) / 8 * 2);
      EXPECT_EQ(verify(verifier, digest, signature), TEE_SUCCESS) << row.bits << " " << length;
      if (length > 0) {
        digest.back() ^= 1;
        const bool counts = length * 8 <= std::max(row.bits, row.bits == 521 ? 528U : 0U);
        EXPECT_EQ(verify(verifier, digest, signature) != TEE_SUCCESS, counts) << length;
        digest.back() ^= 1;
      }
      signature[length % signature.size()] ^= 0x40;
      EXPECT_EQ(verify(verifier, digest, signature), TEE_ERROR_SIGNATURE_INVALID);
      for (const bytes& bad : {bytes(), bytes(signature.size()), bytes(signature.size(), 0xFF),
                               bytes(signature.size() + 1, 1)}) {
        EXPECT_EQ(verify(verifier, digest, bad), TEE_ERROR_SIGNATURE_INVALID);
      }
    }
    TEE_FreeOperation(signer);
    TEE_FreeOperation(verifier);
  }
}

}  // namespace
}  // namespace tee::test
