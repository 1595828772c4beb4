// RSA: the platform against libcrypto and against fixed values, and what it refuses.
#include <memory>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "support.h"

namespace tee::test {
namespace {

// A key of 1024 bits; its numbers in the order of ATTRIBUTES.
constexpr uint32_t BITS = 1024;
constexpr size_t LENGTH = BITS / 8;
constexpr uint32_t ATTRIBUTES[] = {TEE_ATTR_RSA_MODULUS,          TEE_ATTR_RSA_PUBLIC_EXPONENT,
                                   TEE_ATTR_RSA_PRIVATE_EXPONENT, TEE_ATTR_RSA_PRIME1,
                                   TEE_ATTR_RSA_PRIME2,           TEE_ATTR_RSA_EXPONENT1,
                                   TEE_ATTR_RSA_EXPONENT2,        TEE_ATTR_RSA_COEFFICIENT};
const std::vector<bytes> NUMBERS = {
    hex("9a856518f7bd2a844aed0df91b40a68185f665083c5462e3cf1188279f4dfb294716d5e98343a6c297ff1e7ba0"
        "36"
        "41430b4186f54e52eabb88052acf2f0d0f764b5a4758f1df0dc67572d3aa17843dad80698ba029197ed933dfa8"
        "70"
        "747cc8741364ea0415fcf1faec64907f1eac540eed54ff5d46c5a1dff1413266f96a2ff3"),
    hex("010001"),
    hex("4736cb4d228030242053f868a242bd7a5c3f1e791934db0e9ad43da7e5278f658ab9df846b56b678608cd783aa"
        "66"
        "d6d50b4efbdffa650481c1428064540ef4dc9cb1c94c602a053b5b86da16d0651b55654c53e932f06572ed930e"
        "fc"
        "6cb9137c21b37c015f748059f5b5fba295daa8dbaad848040e5fd59abf35a712979b7681"),
    hex("c7552a28c5ac55b5bf514d87f11c201b1838a825223752aea4eaa4c333d13ad3ac8db25e4d30e8d00983da2dd7"
        "ba"
        "9a98dd21ecbe7968ef32a519241ef5a4c563"),
    hex("c672f9e085c86c027741a66dbb71adabe583d6a70230fe448099702b8b0198c535c95edda9265ac02d3a22e740"
        "1e"
        "855de4a285583241fb94794717662a5e7831"),
    hex("1ac0101f569fd104c9ff04339924d81e2abaf7bdbc00c6a4cf56f9f38451b0de554ad2c41b01d44c8eea55ee4f"
        "04"
        "28d918dc03a47030a7e1190cedaf05f22dd7"),
    hex("2db9fe83d2afccdb80993afd1bece4c4b01d01cff7bc4c4a828b588260045d2c4be97b977dcb5dabdc8001dce1"
        "34"
        "672cac6b1a68a923f5115024a66a9f26a771"),
    hex("fa11d5c417634a297b8ac6432f050947decc4031423e88a8ae43267d3a5e3702dbb6e34f105a911d6aeee01e2c"
        "3b"
        "b81fa5c7e070c491eeccee43e4c4dfb6da")};

// PKCS#1 v1.5 with SHA-256 of "abc" under that key, made by the openssl command.
const bytes ABC = hex("ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
const bytes ABC_SIGNATURE = hex(
    "7371aed67238efcbadf644abe69e7da0cbc6e37bca246bac7faf6202d05f586f50dd50ee99a4a53a9b875e82492c"
    "a3833dd1594b76f0d6f4f7357f5ea20a961968be19a19f4b417af315db2229a4cb4c2aa1db5864b553df829e1d05"
    "45e2f4525800575a67557c003f0d6bafca88a3b7d19e259deb733ecdc7cbbc24ac7423f6");

constexpr size_t PUBLIC_HALF = 2;
constexpr size_t WITHOUT_CRT = 3;

// Populates with the first `count` numbers.
TEE_ObjectHandle rsa_key(uint32_t type, const std::vector<bytes>& numbers, size_t count,
                         TEE_Result* result) {
  std::vector<TEE_Attribute> attributes;
  for (size_t i = 0; i < count; ++i)
    attributes.push_back(ref(ATTRIBUTES[i], numbers[i]));
  return populate(type, BITS, attributes, result);
}

TEE_OperationHandle rsa_operation(uint32_t algorithm, uint32_t mode) {
  TEE_Result result = TEE_SUCCESS;
  auto key = rsa_key(TEE_TYPE_RSA_KEYPAIR, NUMBERS, NUMBERS.size(), &result);
  EXPECT_EQ(result, TEE_SUCCESS);
  return operation(algorithm, mode, mode == TEE_MODE_EXPORT ? 0 : BITS, key);
}

using crypt_call = TEE_Result (*)(TEE_OperationHandle, const TEE_Attribute*, uint32_t, const void*,
                                  size_t, void*, size_t*);

// One encryption or decryption, asked for its length first; *result is what it gave.
bytes crypt(uint32_t algorithm, uint32_t mode, const bytes& input, TEE_Result* result) {
  TEE_OperationHandle op = rsa_operation(algorithm, mode);
  crypt_call call = mode == TEE_MODE_ENCRYPT ? TEE_AsymmetricEncrypt : TEE_AsymmetricDecrypt;
  size_t length = 0;
  *result = call(op, nullptr, 0, input.data(), input.size(), nullptr, &length);
  bytes output(length);
  if (*result == TEE_ERROR_SHORT_BUFFER) {
    *result = call(op, nullptr, 0, input.data(), input.size(), output.data(), &length);
  }
  output.resize(*result == TEE_SUCCESS ? length : 0);
  TEE_FreeOperation(op);
  return output;
}

bytes sign(uint32_t algorithm, const std::vector<TEE_Attribute>& params, const bytes& digest,
           TEE_Result* result) {
  TEE_OperationHandle op = rsa_operation(algorithm, TEE_MODE_SIGN);
  auto count = static_cast<uint32_t>(params.size());
  bytes signature(LENGTH);
  size_t length = LENGTH - 1;
  EXPECT_EQ(TEE_AsymmetricSignDigest(op, params.data(), count, digest.data(), digest.size(),
                                     signature.data(), &length),
            TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(length, LENGTH);
  *result = TEE_AsymmetricSignDigest(op, params.data(), count, digest.data(), digest.size(),
                                     signature.data(), &length);
  TEE_FreeOperation(op);
  return signature;
}

TEE_Result verify(uint32_t algorithm, const std::vector<TEE_Attribute>& params, const bytes& digest,
                  const bytes& signature) {
  TEE_OperationHandle op = rsa_operation(algorithm, TEE_MODE_VERIFY);
  TEE_Result result =
      TEE_AsymmetricVerifyDigest(op, params.data(), static_cast<uint32_t>(params.size()),
                                 digest.data(), digest.size(), signature.data(), signature.size());
  TEE_FreeOperation(op);
  return result;
}

// The public half as the platform exports it, ready for one use in libcrypto.
struct exported_key {
  std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> pkey{nullptr, EVP_PKEY_free};
  std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)> use{nullptr, EVP_PKEY_CTX_free};

  exported_key(int (*init)(EVP_PKEY_CTX*), int padding) {
    TEE_OperationHandle op = rsa_operation(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT);
    size_t length = 0;
    EXPECT_EQ(TEE_AsymmetricExport(op, TEE_EXPORT_FORMAT_SPKI, nullptr, &length),
              TEE_ERROR_SHORT_BUFFER);
    bytes der(length);
    EXPECT_EQ(TEE_AsymmetricExport(op, TEE_EXPORT_FORMAT_SPKI, der.data(), &length), TEE_SUCCESS);
    EXPECT_EQ(TEE_AsymmetricExport(op, 4, der.data(), &length), TEE_ERROR_NOT_SUPPORTED);
    TEE_FreeOperation(op);
    const uint8_t* cursor = der.data();
    pkey.reset(d2i_PUBKEY(nullptr, &cursor, static_cast<long>(length)));
    use.reset(EVP_PKEY_CTX_new(pkey.get(), nullptr));
    EXPECT_EQ(init(use.get()), 1);
    EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(use.get(), padding), 1);
  }
};

const EVP_MD* const DIGESTS[] = {EVP_md5(),    EVP_sha1(),   EVP_sha224(),
                                 EVP_sha256(), EVP_sha384(), EVP_sha512()};

using rsa = in_instance;
using rsa_death = in_instance;

TEST_F(rsa, a_signature_of_the_openssl_command) {
  TEE_Result result = TEE_SUCCESS;
  EXPECT_EQ(sign(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, {}, ABC, &result), ABC_SIGNATURE);
  EXPECT_EQ(result, TEE_SUCCESS);
  for (size_t changed = 0; changed < LENGTH; ++changed) {
    bytes forged = ABC_SIGNATURE;
    forged[changed] ^= 0x10;
    EXPECT_EQ(verify(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, {}, ABC, forged),
              TEE_ERROR_SIGNATURE_INVALID);
  }
  for (size_t length : {size_t{0}, LENGTH - 1, LENGTH + 1, 2 * LENGTH}) {
    bytes cut = ABC_SIGNATURE;
    cut.resize(length);
    EXPECT_EQ(verify(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, {}, ABC, cut), TEE_ERROR_SIGNATURE_INVALID);
  }
}

// A signature is as long as the modulus (RFC 8017, 8.1.2): without its leading zero, the same number
// is none. One in 256 begins with a zero.
TEST_F(rsa, a_signature_keeps_its_leading_zero) {
  bytes signature{1};
  for (int tries = 0; tries < 10000 && signature[0] != 0; ++tries) {
    TEE_Result result = TEE_SUCCESS;
    signature = sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, {}, ABC, &result);
  }
  ASSERT_EQ(signature[0], 0);
  EXPECT_EQ(verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, {}, ABC, signature), TEE_SUCCESS);
  signature.erase(signature.begin());
  EXPECT_EQ(verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, {}, ABC, signature),
            TEE_ERROR_SIGNATURE_INVALID);
}

// Every signature algorithm: libcrypto accepts what the platform signs with each salt.
TEST_F(rsa, libcrypto_accepts_every_kind_of_signature) {
  for (uint32_t n = 0; n < 6; ++n) {
    const uint32_t pkcs1 = TEE_ALG_RSASSA_PKCS1_V1_5_MD5 + n * 0x1000;
    const uint32_t pss = TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1 + (n - 1) * 0x101000;
    auto hash_length = static_cast<size_t>(EVP_MD_get_size(DIGESTS[n]));
    const bytes digest(hash_length, 0x5C);
    const std::vector<TEE_Attribute> longest{
        value(TEE_ATTR_RSA_PSS_SALT_LENGTH, TEE_PSS_SALT_MAX_LENGTH)};
    const struct {
      bool pss;
      std::vector<TEE_Attribute> params;
      int salt;
    } rows[] = {
        {false, {}, 0},
        {true, {}, static_cast<int>(hash_length)},
        {true,
         {value(TEE_ATTR_RSA_PSS_SALT_LENGTH, TEE_PSS_SALT_DIGEST_LENGTH)},
         static_cast<int>(hash_length)},
        {true, longest, static_cast<int>(LENGTH - hash_length - 2)},
        {true, {value(TEE_ATTR_RSA_PSS_SALT_LENGTH, 7)}, 7},
    };
    for (const auto& row : rows) {
      if (row.pss && n == 0) continue;  // no PSS with MD5
      // SHA-512 and its own length of salt do not fit 1024 bits.
      bool fits = !row.pss || static_cast<size_t>(row.salt) + hash_length + 2 <= LENGTH;
      const uint32_t algorithm = row.pss ? pss : pkcs1;
      TEE_Result result = TEE_SUCCESS;
      const bytes signature = sign(algorithm, row.params, digest, &result);
      EXPECT_EQ(result, fits ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS);
      if (!fits) continue;
      EXPECT_EQ(verify(algorithm, row.params, digest, signature), TEE_SUCCESS);
      EXPECT_EQ(verify(algorithm, longest, digest, signature), TEE_SUCCESS);
      exported_key key(EVP_PKEY_verify_init, row.pss ? RSA_PKCS1_PSS_PADDING : RSA_PKCS1_PADDING);
      ASSERT_EQ(EVP_PKEY_CTX_set_signature_md(key.use.get(), DIGESTS[n]), 1);
      ASSERT_TRUE(!row.pss || EVP_PKEY_CTX_set_rsa_pss_saltlen(key.use.get(), row.salt) == 1);
      EXPECT_EQ(
          EVP_PKEY_verify(key.use.get(), signature.data(), LENGTH, digest.data(), digest.size()), 1)
          << std::hex << algorithm;
    }
  }
}

// Every encryption algorithm at its limit, decrypted from libcrypto's ciphertext and the
// platform's.
TEST_F(rsa, every_kind_of_encryption) {
  for (uint32_t n = 0; n < 6; ++n) {
    const uint32_t step = (n - 1) * 0x100000;
    const std::vector<uint32_t> algorithms =
        n == 0 ? std::vector<uint32_t>{TEE_ALG_RSAES_PKCS1_V1_5}
               : std::vector<uint32_t>{TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1 + step,
                                       TEE_ALG_RSAES_OAEP_PLATFORM_SHA1 + step};
    auto hash_length = static_cast<size_t>(EVP_MD_get_size(DIGESTS[n]));
    size_t overhead = n == 0 ? 11 : 2 * hash_length + 2;
    if (overhead > LENGTH) {  // SHA-512: not even an empty message fits
      TEE_Result result = TEE_SUCCESS;
      crypt(algorithms[0], TEE_MODE_ENCRYPT, {}, &result);
      EXPECT_EQ(result, TEE_ERROR_BAD_PARAMETERS);
      continue;
    }
    const bytes message(LENGTH - overhead, 0x42);
    exported_key key(EVP_PKEY_encrypt_init, n == 0 ? RSA_PKCS1_PADDING : RSA_PKCS1_OAEP_PADDING);
    ASSERT_TRUE(n == 0 || EVP_PKEY_CTX_set_rsa_oaep_md(key.use.get(), DIGESTS[n]) == 1);
    bytes foreign(LENGTH);
    size_t length = LENGTH;
    ASSERT_EQ(
        EVP_PKEY_encrypt(key.use.get(), foreign.data(), &length, message.data(), message.size()),
        1);
    for (uint32_t algorithm : algorithms) {
      TEE_Result result = TEE_SUCCESS;
      bytes own = crypt(algorithm, TEE_MODE_ENCRYPT, message, &result);
      EXPECT_EQ(own.size(), LENGTH);
      EXPECT_EQ(crypt(algorithm, TEE_MODE_DECRYPT, own, &result), message);
      EXPECT_EQ(crypt(algorithm, TEE_MODE_DECRYPT, foreign, &result), message);
      bytes longer = message;
      longer.push_back(0);
      crypt(algorithm, TEE_MODE_ENCRYPT, longer, &result);
      EXPECT_EQ(result, TEE_ERROR_BAD_PARAMETERS);
      own.pop_back();
      crypt(algorithm, TEE_MODE_DECRYPT, own, &result);
      EXPECT_EQ(result, TEE_ERROR_BAD_PARAMETERS);
      if (n == 0) continue;  // what a wrong v1.5 padding gives is libcrypto's secret
      foreign[LENGTH - 1] ^= 1;
      crypt(algorithm, TEE_MODE_DECRYPT, foreign, &result);
      EXPECT_EQ(result, TEE_ERROR_BAD_PARAMETERS);
      foreign[LENGTH - 1] ^= 1;
    }
  }
}

TEST_F(rsa, raw_numbers) {
  const bytes& n = NUMBERS[0];
  bytes below = n;
  below.back() -= 1;  // n is odd
  bytes above = n;
  above.back() += 1;
  bytes longer(1);
  longer.insert(longer.end(), below.begin(), below.end());
  const struct {
    bytes input, output;
    TEE_Result result;
  } rows[] = {
      {{}, {0}, TEE_SUCCESS},
      {{0}, {0}, TEE_SUCCESS},
      {{1}, {1}, TEE_SUCCESS},
      {bytes(LENGTH), {0}, TEE_SUCCESS},
      {below, below, TEE_SUCCESS},  // -1 to an odd power
      {n, {}, TEE_ERROR_BAD_PARAMETERS},
      {above, {}, TEE_ERROR_BAD_PARAMETERS},
      {longer, {}, TEE_ERROR_BAD_PARAMETERS},
  };
  for (const auto& row : rows) {
    for (uint32_t mode : {TEE_MODE_ENCRYPT, TEE_MODE_DECRYPT}) {
      TEE_Result result = TEE_SUCCESS;
      EXPECT_EQ(crypt(TEE_ALG_RSA_NOPAD, mode, row.input, &result), row.output);
      EXPECT_EQ(result, row.result);
    }
  }
  TEE_Result result = TEE_SUCCESS;
  bytes block = crypt(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, ABC_SIGNATURE, &result);
  EXPECT_EQ(block.size(), LENGTH - 1);  // 00 01 FF ... without its first byte
  EXPECT_EQ(crypt(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, block, &result), ABC_SIGNATURE);
}

// One number of the key changed; `count` numbers given.
TEST_F(rsa, keys_are_checked_when_populated) {
  auto with_zeros = [](bytes number) {
    number.insert(number.begin(), 3, 0);
    return number;
  };
  bytes even = NUMBERS[0];
  even.back() &= 0xFE;
  const struct {
    size_t changed;
    bytes number;
    size_t count;
    TEE_Result result;
  } rows[] = {
      {0, NUMBERS[0], 8, TEE_SUCCESS},
      {0, with_zeros(NUMBERS[0]), 8, TEE_SUCCESS},
      {2, with_zeros(NUMBERS[2]), 3, TEE_SUCCESS},
      {7, with_zeros(NUMBERS[7]), 8, TEE_SUCCESS},
      {0, even, 3, TEE_ERROR_BAD_PARAMETERS},
      {0, {}, 3, TEE_ERROR_BAD_PARAMETERS},
      {0, bytes(LENGTH), 3, TEE_ERROR_BAD_PARAMETERS},
      {0, bytes(60, 0xFF), 3, TEE_ERROR_BAD_PARAMETERS},
      {0, bytes(LENGTH + 1, 0xFF), 3, TEE_ERROR_BAD_PARAMETERS},
      {1, {1}, 3, TEE_ERROR_BAD_PARAMETERS},
      {1, {2}, 3, TEE_ERROR_BAD_PARAMETERS},
      {1, {3}, 3, TEE_ERROR_BAD_PARAMETERS},
      {1, {3}, 8, TEE_ERROR_BAD_PARAMETERS},
      {1, bytes(LENGTH, 0xFF), 3, TEE_ERROR_BAD_PARAMETERS},
      {2, {5}, 3, TEE_ERROR_BAD_PARAMETERS},
      {2, {}, 8, TEE_ERROR_BAD_PARAMETERS},
      {2, bytes(LENGTH * 2, 0xFF), 3, TEE_ERROR_BAD_PARAMETERS},
      {3, NUMBERS[4], 8, TEE_ERROR_BAD_PARAMETERS},
      {3, {}, 8, TEE_ERROR_BAD_PARAMETERS},
      {3, {1}, 8, TEE_ERROR_BAD_PARAMETERS},
      {5, NUMBERS[6], 8, TEE_ERROR_BAD_PARAMETERS},
      {7, {1}, 8, TEE_ERROR_BAD_PARAMETERS},
      {6, NUMBERS[6], 7, TEE_ERROR_BAD_PARAMETERS},
  };
  for (const auto& row : rows) {
    std::vector<bytes> numbers = NUMBERS;
    numbers[row.changed] = row.number;
    TEE_Result result = TEE_SUCCESS;
    TEE_ObjectHandle key = rsa_key(TEE_TYPE_RSA_KEYPAIR, numbers, row.count, &result);
    EXPECT_EQ(result, row.result) << row.changed << " of " << row.count;
    TEE_ObjectInfo info;
    ASSERT_EQ(TEE_GetObjectInfo1(key, &info), TEE_SUCCESS);
    EXPECT_EQ(info.objectSize, row.result == TEE_SUCCESS ? BITS : 0);
    TEE_FreeTransientObject(key);
  }
}

// Without CRT numbers, with empty ones, and with the public half alone.
TEST_F(rsa, partial_keys_work) {
  std::vector<bytes> empty_crt = NUMBERS;
  std::fill(empty_crt.begin() + WITHOUT_CRT, empty_crt.end(), bytes{});
  TEE_Result result = TEE_SUCCESS;
  for (size_t count : {WITHOUT_CRT, NUMBERS.size()}) {
    auto op = operation(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN, BITS,
                        rsa_key(TEE_TYPE_RSA_KEYPAIR, empty_crt, count, &result));
    bytes signature(LENGTH);
    size_t length = LENGTH;
    EXPECT_EQ(
        TEE_AsymmetricSignDigest(op, nullptr, 0, ABC.data(), ABC.size(), signature.data(), &length),
        TEE_SUCCESS);
    EXPECT_EQ(signature, ABC_SIGNATURE);
    TEE_FreeOperation(op);
  }
  auto op = operation(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_VERIFY, BITS,
                      rsa_key(TEE_TYPE_RSA_PUBLIC_KEY, NUMBERS, PUBLIC_HALF, &result));
  EXPECT_EQ(TEE_AsymmetricVerifyDigest(op, nullptr, 0, ABC.data(), ABC.size(), ABC_SIGNATURE.data(),
                                       LENGTH),
            TEE_SUCCESS);
  TEE_FreeOperation(op);
}

TEST_F(rsa, generated_keys_have_the_size_and_exponent_asked_for) {
  const struct {
    uint32_t bits;
    bytes exponent, kept;
    TEE_Result result;
  } rows[] = {
      {512, {}, hex("010001"), TEE_SUCCESS},
      {520, hex("0000000000010001"), hex("010001"), TEE_SUCCESS},
      {1024, hex("03"), hex("03"), TEE_SUCCESS},
      {2048, hex("8000000000000003"), hex("8000000000000003"), TEE_SUCCESS},
      {512, hex("0000000000000001"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("0000000000010000"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("00"), {}, TEE_ERROR_BAD_PARAMETERS},
      {512, hex("010000000000000001"), {}, TEE_ERROR_BAD_PARAMETERS},
  };
  for (const auto& row : rows) {
    TEE_ObjectHandle object = nullptr;
    ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_RSA_KEYPAIR, row.bits, &object), TEE_SUCCESS);
    const TEE_Attribute exponent = ref(TEE_ATTR_RSA_PUBLIC_EXPONENT, row.exponent);
    ASSERT_EQ(TEE_GenerateKey(object, row.bits, &exponent, row.exponent.empty() ? 0 : 1),
              row.result);
    if (row.result == TEE_SUCCESS) {
      bytes room(row.bits / 8);
      size_t length = room.size();
      TEE_GetObjectBufferAttribute(object, TEE_ATTR_RSA_MODULUS, room.data(), &length);
      EXPECT_EQ(length, row.bits / 8);
      EXPECT_GE(room[0], 0x80);
      TEE_GetObjectBufferAttribute(object, TEE_ATTR_RSA_PUBLIC_EXPONENT, room.data(), &length);
      room.resize(length);
      EXPECT_EQ(room, row.kept);
    }
    TEE_FreeTransientObject(object);
  }
}

TEST_F(rsa_death, digests_of_another_length_panic) {
  TEE_OperationHandle op = rsa_operation(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN);
  uint8_t out[LENGTH];
  size_t length = LENGTH;
  EXPECT_DEATH(TEE_AsymmetricSignDigest(op, nullptr, 0, out, 31, out, &length),
               "panic: TEE_AsymmetricSignDigest: a digest of 31 bytes, not 32");
}

}  // namespace
}  // namespace tee::test
