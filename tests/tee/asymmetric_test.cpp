// RSA and ECDSA in what the command-level matrix against libcrypto does not reach: digests of any
// length, signatures with a leading zero.
#include <algorithm>
#include <array>

#include "support.h"

namespace tee::test {
namespace {

using asymmetric = in_instance;

// Operations of two modes with a new key; by default those that sign and verify.
std::array<TEE_OperationHandle, 2> on_new_key(uint32_t type, uint32_t bits, uint32_t algorithm,
                                              const std::vector<TEE_Attribute>& params,
                                              std::array<uint32_t, 2> modes = {TEE_MODE_SIGN,
                                                                               TEE_MODE_VERIFY}) {
  TEE_ObjectHandle key = nullptr;
  EXPECT_EQ(TEE_AllocateTransientObject(type, bits, &key), TEE_SUCCESS);
  EXPECT_EQ(TEE_GenerateKey(key, bits, params.data(), static_cast<uint32_t>(params.size())),
            TEE_SUCCESS);
  std::array ops = {operation(algorithm, modes[0], bits, nullptr),
                    operation(algorithm, modes[1], bits, nullptr)};
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
  EXPECT_DEATH(sign(signer, bytes(19)), "panic: .*: a digest of 19 bytes, not 20");
  TEE_FreeOperation(signer);
  TEE_FreeOperation(verifier);
}

constexpr std::array<uint32_t, 2> CRYPTS = {TEE_MODE_ENCRYPT, TEE_MODE_DECRYPT};

// What was encrypted under a label and a digest of MGF1 opens under the same ones alone.
TEST_F(asymmetric, oaep_heeds_label_and_mask_digest) {
  auto [encrypter, decrypter] =
      on_new_key(TEE_TYPE_RSA_KEYPAIR, 1024, TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256, {}, CRYPTS);
  const auto digest = [](uint32_t id) {
    const auto* begin = reinterpret_cast<const uint8_t*>(&id);
    return bytes(begin, begin + sizeof(id));
  };
  const bytes label = {'L'};
  const bytes sha1 = digest(TEE_ALG_SHA1);
  const bytes sha256 = digest(TEE_ALG_SHA256);
  const bytes unknown = digest(TEE_ALG_HMAC_SHA1);
  const std::vector<TEE_Attribute> none;
  const std::vector<TEE_Attribute> usual = {ref(TEE_ATTR_RSA_OAEP_LABEL, {}),
                                            ref(TEE_ATTR_RSA_OAEP_MGF_HASH, sha256)};
  const std::vector<TEE_Attribute> labelled = {ref(TEE_ATTR_RSA_OAEP_LABEL, label)};
  const std::vector<TEE_Attribute> masked = {ref(TEE_ATTR_RSA_OAEP_MGF_HASH, sha1)};
  const std::vector<TEE_Attribute>* ways[] = {&none, &labelled, &masked};
  bytes sealed(128);
  bytes opened(128);
  const auto run = [](auto function, auto op, const auto& params, const bytes& in, bytes* out) {
    size_t length = out->size();
    return function(op, params.data(), static_cast<uint32_t>(params.size()), in.data(), in.size(),
                    out->data(), &length);
  };
  for (const auto* there : ways) {
    ASSERT_EQ(run(TEE_AsymmetricEncrypt, encrypter, *there, label, &sealed), TEE_SUCCESS);
    for (const auto* back : ways) {
      const TEE_Result expected = there == back ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
      EXPECT_EQ(run(TEE_AsymmetricDecrypt, decrypter, *back, sealed, &opened), expected);
    }
  }
  ASSERT_EQ(run(TEE_AsymmetricEncrypt, encrypter, usual, label, &sealed), TEE_SUCCESS);
  EXPECT_EQ(run(TEE_AsymmetricDecrypt, decrypter, none, sealed, &opened), TEE_SUCCESS);
  const std::vector<TEE_Attribute> refused = {ref(TEE_ATTR_RSA_OAEP_MGF_HASH, unknown)};
  EXPECT_EQ(run(TEE_AsymmetricEncrypt, encrypter, refused, label, &sealed),
            TEE_ERROR_NOT_SUPPORTED);
  TEE_FreeOperation(encrypter);
  TEE_FreeOperation(decrypter);
}

// Of the forms in which a public key could go out there is one.
TEST_F(asymmetric, keys_are_exported_in_one_form) {
  auto [exporter, other] = on_new_key(TEE_TYPE_RSA_KEYPAIR, 512, TEE_ALG_RSA_NOPAD, {},
                                      {TEE_MODE_EXPORT, TEE_MODE_ENCRYPT});
  bytes der(200);
  for (uint32_t format = 0; format < 9; format++) {
    size_t length = der.size();
    EXPECT_EQ(TEE_AsymmetricExport(exporter, format, der.data(), &length),
              format == TEE_EXPORT_FORMAT_SPKI ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED);
  }
  TEE_FreeOperation(exporter);
  TEE_FreeOperation(other);
}

// Whatever libcrypto likes to answer: wrong padding is refused.
TEST_F(asymmetric, wrong_pkcs1_padding_is_refused) {
  auto [encrypter, decrypter] =
      on_new_key(TEE_TYPE_RSA_KEYPAIR, 512, TEE_ALG_RSAES_PKCS1_V1_5, {}, CRYPTS);
  const auto opens = [op = decrypter](const bytes& sealed) {
    bytes opened(64);
    size_t length = opened.size();
    return TEE_AsymmetricDecrypt(op, nullptr, 0, sealed.data(), sealed.size(), opened.data(),
                                 &length);
  };
  for (uint8_t fill = 1; fill < 8; ++fill)
    EXPECT_EQ(opens(bytes(64, fill)), TEE_ERROR_BAD_PARAMETERS);
  // A ciphertext is as long as the modulus, also where the same number has fewer bytes.
  bytes sealed(64, 1);
  for (int tries = 0; tries < 10000 && sealed[0] != 0; ++tries) {
    size_t length = sealed.size();
    ASSERT_EQ(TEE_AsymmetricEncrypt(encrypter, nullptr, 0, "x", 1, sealed.data(), &length),
              TEE_SUCCESS);
  }
  EXPECT_EQ(opens(sealed), TEE_SUCCESS);
  EXPECT_EQ(opens(bytes(sealed.begin() + 1, sealed.end())), TEE_ERROR_BAD_PARAMETERS);
  sealed.insert(sealed.begin(), 0);
  EXPECT_EQ(opens(sealed), TEE_ERROR_BAD_PARAMETERS);
  TEE_FreeOperation(encrypter);
  TEE_FreeOperation(decrypter);
}

// An algorithm that names the digest takes keys of any curve, and makes the same signatures as the
// one that names the curve.
TEST_F(asymmetric, ecdsa_under_either_name) {
  TEE_Attribute curve;
  TEE_InitValueAttribute(&curve, TEE_ATTR_ECC_CURVE, TEE_ECC_CURVE_NIST_P384, 0);
  TEE_ObjectHandle key = nullptr;
  ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_ECDSA_KEYPAIR, 384, &key), TEE_SUCCESS);
  ASSERT_EQ(TEE_GenerateKey(key, 384, &curve, 1), TEE_SUCCESS);
  auto verifier = operation(TEE_ALG_ECDSA_P384, TEE_MODE_VERIFY, 384, nullptr);
  ASSERT_EQ(TEE_SetOperationKey(verifier, key), TEE_SUCCESS);
  constexpr std::pair<uint32_t, size_t> DIGESTS[] = {{TEE_ALG_ECDSA_SHA1, 20},
                                                     {TEE_ALG_ECDSA_SHA224, 28},
                                                     {TEE_ALG_ECDSA_SHA256, 32},
                                                     {TEE_ALG_ECDSA_SHA384, 48},
                                                     {TEE_ALG_ECDSA_SHA512, 64}};
  for (const auto& [algorithm, length] : DIGESTS) {
    auto signer = operation(algorithm, TEE_MODE_SIGN, 384, nullptr);
    ASSERT_EQ(TEE_SetOperationKey(signer, key), TEE_SUCCESS);
    const bytes digest(length, 7);
    EXPECT_EQ(verify(verifier, digest, sign(signer, digest)), TEE_SUCCESS) << length;
    EXPECT_DEATH(sign(signer, bytes(length + 1)), "panic: .*: a digest of .* bytes, not");
    TEE_FreeOperation(signer);
  }
  TEE_FreeOperation(verifier);
  TEE_FreeTransientObject(key);
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
