// The adapter in front of a platform without extensions: every call of a test goes through it, as
// those of a trusted application do. Signatures and keys of the other side come from libcrypto.
#include <functional>
#include <openssl/x509.h>

#include "tests/port/support.h"

namespace tee::test {
namespace {

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

// Salts of any length verify; in signing, a code or a length stands for a length that libcrypto
// must find.
TEST_F(adapter, PssTakesSaltsOfAnyLength) {
  for (size_t i = 0; i < std::size(PSS_SIZES) * std::size(PSS_DIGESTS); i++) {
    const unsigned bits = PSS_SIZES[i % std::size(PSS_SIZES)];
    const pss_digest& row = PSS_DIGESTS[i / std::size(PSS_SIZES)];
    SCOPED_TRACE(std::to_string(bits) + " bits, digest of " + std::to_string(row.size));
    const rsa_key& key = key_of(bits);
    const bytes hash(row.size, 0x5A);
    const uint32_t longest = static_cast<uint32_t>((bits + 6) / 8 - row.size - 2);
    bytes signature((bits + 7) / 8);
    size_t size = signature.size();
    const auto verifier = rsa_operation(row.algorithm, TEE_MODE_VERIFY, key.all);
    for (uint32_t salt : {0U, 1U, std::min(longest, 20U), longest}) {
      const auto context = pss_context(key, row, true, static_cast<int>(salt));
      ASSERT_EQ(EVP_PKEY_sign(context.get(), signature.data(), &size, hash.data(), hash.size()), 1);
      EXPECT_EQ(verify(verifier, hash, signature), TEE_SUCCESS) << "salt of " << salt;
      EXPECT_EQ(verify(verifier, bytes(row.size, 0x5B), signature), TEE_ERROR_SIGNATURE_INVALID);
      signature.push_back(0);
      EXPECT_EQ(verify(verifier, hash, signature), TEE_ERROR_SIGNATURE_INVALID);
      signature.pop_back();
    }
    TEE_FreeOperation(verifier);
    const auto signer = rsa_operation(row.algorithm, TEE_MODE_SIGN, key.all);
    const auto digest = std::min(static_cast<uint32_t>(row.size), longest);
    for (auto [code, length] : {std::pair{TEE_PSS_SALT_DIGEST_LENGTH, digest},
                                {TEE_PSS_SALT_MAX_LENGTH, longest},
                                {7U, 7U},
                                {0U, 0U}}) {
      TEE_Attribute salt{};
      TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, code, 0);
      ASSERT_EQ(TEE_AsymmetricSignDigest(signer, &salt, 1, hash.data(), hash.size(),
                                         signature.data(), &size),
                TEE_SUCCESS);
      const auto context = pss_context(key, row, false, static_cast<int>(length));
      EXPECT_EQ(EVP_PKEY_verify(context.get(), signature.data(), size, hash.data(), hash.size()), 1)
          << "code " << code;
    }
    TEE_FreeOperation(signer);
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

}  // namespace
}  // namespace tee::test
