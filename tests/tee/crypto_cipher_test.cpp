// AES against published values, in every way to cut a message up and to place its buffers.
#include <algorithm>
#include <cstring>

#include "support.h"

namespace tee::test {
namespace {

using ciphers = in_instance;
using authenticated = in_instance;

struct cipher_row {
  uint32_t algorithm;
  const char* key;
  const char* iv;
  const char* ciphertext;
};

// NIST SP 800-38A, F: four blocks of plaintext.
const bytes PLAINTEXT =
    hex("6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
        "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710");
constexpr const char* KEY_128 = "2b7e151628aed2a6abf7158809cf4f3c";
constexpr const char* KEY_256 = "603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4";
const cipher_row CIPHERS[] = {
    {TEE_ALG_AES_ECB_NOPAD, KEY_128, "",
     "3ad77bb40d7a3660a89ecaf32466ef97f5d3d58503b9699de785895a96fdbaaf"
     "43b1cd7f598ece23881b00e3ed0306887b0c785e27e8ad3f8223207104725dd4"},
    {TEE_ALG_AES_CBC_NOPAD, KEY_128, "000102030405060708090a0b0c0d0e0f",
     "7649abac8119b246cee98e9b12e9197d5086cb9b507219ee95db113a917678b2"
     "73bed6b8e3c1743b7116e69e222295163ff1caa1681fac09120eca307586e1a7"},
    {TEE_ALG_AES_CTR, KEY_128, "f0f1f2f3f4f5f6f7f8f9fafbfcfdfeff",
     "874d6191b620e3261bef6864990db6ce9806f66b7970fdff8617187bb9fffdff"
     "5ae4df3edbd5d35e5b4f09020db03eab1e031dda2fbe03d1792170a0f3009cee"},
    {TEE_ALG_AES_ECB_NOPAD, KEY_256, "",
     "f3eed1bdb5d2a03c064b5a7e3db181f8591ccb10d410ed26dc5ba74a31362870"
     "b6ed21b99ca6f4f9f153e7b1beafed1d23304b7a39f9f3ff067d8d8f9e24ecc7"},
    {TEE_ALG_AES_CBC_NOPAD, KEY_256, "000102030405060708090a0b0c0d0e0f",
     "f58c4c04d6e5f1ba779eabfb5f7bfbd69cfc4e967edb808d679f777bc6702c7d"
     "39f23369a9d9bacfa530e26304231461b2eb05e2c39be9fcda6c19078c6a9d1b"},
    {TEE_ALG_AES_CTR, KEY_256, "f0f1f2f3f4f5f6f7f8f9fafbfcfdfeff",
     "601ec313775789a5b7a7f504bbf3d228f443e3ca4d62b59aca84e990cacaf5c5"
     "2b0930daa23de94ce87017ba2d84988ddfc9c58db67aada613c2dd08457941a6"},
};

TEE_OperationHandle cipher(const cipher_row& row, uint32_t mode) {
  const bytes key = hex(row.key);
  return operation(row.algorithm, mode, static_cast<uint32_t>(key.size() * 8),
                   secret_key(TEE_TYPE_AES, key));
}

// Runs a message through in updates of `step` bytes, each with exactly the room that it needs,
// after a query that must consume nothing.
bytes in_steps(TEE_OperationHandle op, bool stream, const bytes& input, size_t step) {
  bytes output;
  for (size_t at = 0; at < input.size(); at += step) {
    const bytes part(input.begin() + static_cast<ptrdiff_t>(at),
                     input.begin() + static_cast<ptrdiff_t>(std::min(at + step, input.size())));
    size_t due = at + part.size() - output.size();
    if (!stream) due -= due % 16;
    size_t length = 0;
    TEE_Result query = TEE_CipherUpdate(op, part.data(), part.size(), nullptr, &length);
    EXPECT_EQ(length, due);
    if (due == 0) {
      EXPECT_EQ(query, TEE_SUCCESS);
      continue;
    }
    EXPECT_EQ(query, TEE_ERROR_SHORT_BUFFER);
    bytes room(due);
    EXPECT_EQ(TEE_CipherUpdate(op, part.data(), part.size(), room.data(), &length), TEE_SUCCESS);
    EXPECT_EQ(length, due);
    output.insert(output.end(), room.begin(), room.end());
  }
  size_t length = 0;
  EXPECT_EQ(TEE_CipherDoFinal(op, nullptr, 0, nullptr, &length), TEE_SUCCESS);
  return output;
}

TEST_F(ciphers, published_values_in_every_step) {
  for (const cipher_row& row : CIPHERS) {
    const bytes iv = hex(row.iv);
    const bytes ciphertext = hex(row.ciphertext);
    const bool stream = row.algorithm == TEE_ALG_AES_CTR;
    TEE_OperationHandle encrypt = cipher(row, TEE_MODE_ENCRYPT);
    TEE_OperationHandle decrypt = cipher(row, TEE_MODE_DECRYPT);
    for (size_t step = 1; step <= PLAINTEXT.size(); ++step) {
      TEE_CipherInit(encrypt, iv.data(), iv.size());
      EXPECT_EQ(in_steps(encrypt, stream, PLAINTEXT, step), ciphertext) << step;
      TEE_CipherInit(decrypt, iv.data(), iv.size());
      EXPECT_EQ(in_steps(decrypt, stream, ciphertext, step), PLAINTEXT) << step;
    }
    TEE_FreeOperation(encrypt);
    TEE_FreeOperation(decrypt);
  }
}

// The destination at every distance from the source, with and without bytes held from before.
TEST_F(ciphers, buffers_may_overlap) {
  constexpr ptrdiff_t REACH = 20;
  for (const cipher_row& row : CIPHERS) {
    const bytes iv = hex(row.iv);
    const bytes ciphertext = hex(row.ciphertext);
    TEE_OperationHandle op = cipher(row, TEE_MODE_ENCRYPT);
    for (size_t held : {size_t{0}, size_t{5}}) {
      for (ptrdiff_t distance = -REACH; distance <= REACH; ++distance) {
        TEE_CipherInit(op, iv.data(), iv.size());
        bytes first(16);
        size_t first_length = first.size();
        ASSERT_EQ(TEE_CipherUpdate(op, PLAINTEXT.data(), held, first.data(), &first_length),
                  TEE_SUCCESS);
        bytes room(PLAINTEXT.size() + 2 * REACH);
        uint8_t* source = room.data() + REACH;
        uint8_t* target = source + distance;
        std::copy(PLAINTEXT.begin() + static_cast<ptrdiff_t>(held), PLAINTEXT.end(), source);
        size_t length = ciphertext.size() - first_length;
        ASSERT_EQ(TEE_CipherUpdate(op, source, PLAINTEXT.size() - held, target, &length),
                  TEE_SUCCESS);
        EXPECT_EQ(
            bytes(target, target + length),
            bytes(ciphertext.begin() + static_cast<ptrdiff_t>(first_length), ciphertext.end()))
            << distance;
      }
    }
    TEE_FreeOperation(op);
  }
}

struct gcm_row {
  const char* key;
  const char* nonce;
  const char* associated;
  size_t length;  // of PLAIN that is encrypted
  const char* ciphertext;
  const char* tag;
};

// D. McGrew, J. Viega: The Galois/Counter Mode of Operation, test cases 1, 3, 4, 5, 13 and 16.
const bytes PLAIN =
    hex("d9313225f88406e5a55909c5aff5269a86a7a9531534f7da2e4c303d8a318a72"
        "1c3c0c95956809532fcf0e2449a6b525b16aedf5aa0de657ba637b391aafd255");
constexpr const char* GCM_KEY_128 = "feffe9928665731c6d6a8f9467308308";
constexpr const char* ASSOCIATED = "feedfacedeadbeeffeedfacedeadbeefabaddad2";
const gcm_row GCM[] = {
    {"00000000000000000000000000000000", "000000000000000000000000", "", 0, "",
     "58e2fccefa7e3061367f1d57a4e7455a"},
    {GCM_KEY_128, "cafebabefacedbaddecaf888", "", 64,
     "42831ec2217774244b7221b784d0d49ce3aa212f2c02a4e035c17e2329aca12e"
     "21d514b25466931c7d8f6a5aac84aa051ba30b396a0aac973d58e091473f5985",
     "4d5c2af327cd64a62cf35abd2ba6fab4"},
    {GCM_KEY_128, "cafebabefacedbaddecaf888", ASSOCIATED, 60,
     "42831ec2217774244b7221b784d0d49ce3aa212f2c02a4e035c17e2329aca12e"
     "21d514b25466931c7d8f6a5aac84aa051ba30b396a0aac973d58e091",
     "5bc94fbc3221a5db94fae95ae7121a47"},
    {GCM_KEY_128, "cafebabefacedbad", ASSOCIATED, 60,
     "61353b4c2806934a777ff51fa22a4755699b2a714fcdc6f83766e5f97b6c7423"
     "73806900e49f24b22b097544d4896b424989b5e1ebac0f07c23f4598",
     "3612d2e79e3b0785561be14aaca2fccb"},
    {"0000000000000000000000000000000000000000000000000000000000000000", "000000000000000000000000",
     "", 0, "", "530f8afbc74536b9a963b4f1c4cb738b"},
    {"feffe9928665731c6d6a8f9467308308feffe9928665731c6d6a8f9467308308", "cafebabefacedbaddecaf888",
     ASSOCIATED, 60,
     "522dc1f099567d07f47f37a32a84427d643a8cdcbfe5c0c97598a2bd2555d1aa"
     "8cb08e48590dbb3da7b08b1056828838c5f61e6393ba7a0abcc9f662",
     "76fc6ece0f4e1768cddf8853bb2d551b"},
};

struct gcm_case {
  bytes key, nonce, associated, plaintext, ciphertext, tag;

  explicit gcm_case(const gcm_row& row)
      : key(hex(row.key)),
        nonce(hex(row.nonce)),
        associated(hex(row.associated)),
        plaintext(PLAIN.begin(), PLAIN.begin() + static_cast<ptrdiff_t>(row.length)),
        ciphertext(hex(row.ciphertext)),
        tag(hex(row.tag)) {}

  TEE_OperationHandle begin(uint32_t mode) const {
    return operation(TEE_ALG_AES_GCM, mode, static_cast<uint32_t>(key.size() * 8),
                     secret_key(TEE_TYPE_AES, key));
  }
  // Starts a message, the associated data in two parts.
  void start(TEE_OperationHandle op, uint32_t tag_bits = 128) const {
    ASSERT_EQ(TEE_AEInit(op, nonce.data(), nonce.size(), tag_bits, 0, 0), TEE_SUCCESS);
    size_t half = associated.size() / 2;
    TEE_AEUpdateAAD(op, associated.data(), half);
    TEE_AEUpdateAAD(op, associated.data() + half, associated.size() - half);
  }
};

// Feeds all but the last few bytes in steps; returns what came out and what is left for the final.
bytes feed(TEE_OperationHandle op, const bytes& input, size_t step, bytes* rest) {
  bytes output;
  size_t at = 0;
  for (; at + step < input.size(); at += step) {
    bytes room(step);
    size_t length = step - 1;
    EXPECT_EQ(TEE_AEUpdate(op, input.data() + at, step, room.data(), &length),
              TEE_ERROR_SHORT_BUFFER);
    EXPECT_EQ(TEE_AEUpdate(op, input.data() + at, step, room.data(), &length), TEE_SUCCESS);
    output.insert(output.end(), room.begin(), room.end());
  }
  rest->assign(input.begin() + static_cast<ptrdiff_t>(at), input.end());
  return output;
}

TEST_F(authenticated, published_values_in_steps) {
  for (const gcm_row& row : GCM) {
    const gcm_case message(row);
    TEE_OperationHandle encrypt = message.begin(TEE_MODE_ENCRYPT);
    TEE_OperationHandle decrypt = message.begin(TEE_MODE_DECRYPT);
    for (size_t step = 1; step <= 20; ++step) {
      message.start(encrypt);
      bytes rest;
      bytes output = feed(encrypt, message.plaintext, step, &rest);
      bytes tag(15);
      size_t tag_length = tag.size();
      size_t length = 0;
      EXPECT_EQ(TEE_AEEncryptFinal(encrypt, rest.data(), rest.size(), nullptr, &length, tag.data(),
                                   &tag_length),
                TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, rest.size());
      ASSERT_EQ(tag_length, 16U);
      tag.resize(tag_length);
      EXPECT_EQ(TEE_AEEncryptFinal(encrypt, rest.data(), rest.size(), rest.data(), &length,
                                   tag.data(), &tag_length),
                TEE_SUCCESS);
      output.insert(output.end(), rest.begin(), rest.end());
      EXPECT_EQ(output, message.ciphertext);
      EXPECT_EQ(tag, message.tag);

      message.start(decrypt);
      output = feed(decrypt, message.ciphertext, step, &rest);
      length = rest.size();
      EXPECT_EQ(TEE_AEDecryptFinal(decrypt, rest.data(), rest.size(), rest.data(), &length,
                                   tag.data(), tag.size()),
                TEE_SUCCESS);
      output.insert(output.end(), rest.begin(), rest.end());
      EXPECT_EQ(output, message.plaintext);
    }
    TEE_FreeOperation(encrypt);
    TEE_FreeOperation(decrypt);
  }
}

// Every changed bit of a tag, every wrong length, a changed message and changed associated data are
// seen; the output of the failed call is wiped and the operation can be used again.
TEST_F(authenticated, forgeries_are_refused) {
  const gcm_case good(GCM[2]);
  TEE_OperationHandle op = good.begin(TEE_MODE_DECRYPT);
  auto check = [&](const gcm_case& message, size_t tag_length, TEE_Result expected) {
    message.start(op, 128);
    bytes output(message.ciphertext.size());
    size_t length = output.size();
    bytes tag = message.tag;
    EXPECT_EQ(TEE_AEDecryptFinal(op, message.ciphertext.data(), length, output.data(), &length,
                                 tag.data(), tag_length),
              expected);
    if (expected != TEE_SUCCESS) {
      EXPECT_EQ(output, bytes(output.size()));
    }
  };
  for (size_t bit = 0; bit < 128; ++bit) {
    gcm_case forged = good;
    forged.tag[bit / 8] ^= static_cast<uint8_t>(1U << (bit % 8));
    check(forged, 16, TEE_ERROR_MAC_INVALID);
  }
  for (size_t length = 0; length < 16; ++length)
    check(good, length, TEE_ERROR_MAC_INVALID);
  gcm_case changed = good;
  changed.ciphertext[59] ^= 1;
  check(changed, 16, TEE_ERROR_MAC_INVALID);
  changed = good;
  changed.associated[0] ^= 1;
  check(changed, 16, TEE_ERROR_MAC_INVALID);
  check(good, 16, TEE_SUCCESS);
  TEE_FreeOperation(op);
}

TEST_F(authenticated, tag_and_nonce_lengths) {
  const gcm_case message(GCM[2]);
  TEE_OperationHandle op = message.begin(TEE_MODE_ENCRYPT);
  for (uint32_t bits = 0; bits <= 136; ++bits) {
    bool valid = bits >= 96 && bits <= 128 && bits % 8 == 0;
    if (!valid) {
      EXPECT_EQ(TEE_AEInit(op, message.nonce.data(), 12, bits, 0, 0), TEE_ERROR_NOT_SUPPORTED);
      continue;
    }
    message.start(op, bits);
    bytes output(message.plaintext.size());
    size_t length = output.size();
    bytes tag(bits / 8);
    size_t tag_length = tag.size();
    EXPECT_EQ(TEE_AEEncryptFinal(op, message.plaintext.data(), length, output.data(), &length,
                                 tag.data(), &tag_length),
              TEE_SUCCESS);
    EXPECT_EQ(tag,
              bytes(message.tag.begin(), message.tag.begin() + static_cast<ptrdiff_t>(bits / 8)));
  }
  EXPECT_EQ(TEE_AEInit(op, nullptr, 0, 128, 0, 0), TEE_ERROR_NOT_SUPPORTED);
  // A message longer than the algorithm allows is refused before a byte of it is read.
  message.start(op);
  uint8_t byte = 0;
  size_t length = (size_t{1} << 36) - 31;
  EXPECT_EQ(TEE_AEUpdate(op, &byte, length, &byte, &length), TEE_ERROR_EXCESS_DATA);
  length = 1;
  EXPECT_EQ(TEE_AEUpdate(op, &byte, length, &byte, &length), TEE_SUCCESS);
  TEE_FreeOperation(op);
}

}  // namespace
}  // namespace tee::test
