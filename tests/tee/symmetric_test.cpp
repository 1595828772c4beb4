// Digests, MACs and ciphers in what no trusted application of ours asks for: queries, overlapping
// buffers, tags of every length. The published values are those of the command-level tests too.
#include <algorithm>

#include "support.h"

namespace tee::test {
namespace {

using symmetric = in_instance;

const bytes PLAIN =
    hex("d9313225f88406e5a55909c5aff5269a86a7a9531534f7da2e4c303d8a318a72"
        "1c3c0c95956809532fcf0e2449a6b525b16aedf5aa0de657ba637b39");

// A query of the length takes nothing in, and the second round finds the operation fresh.
TEST_F(symmetric, digests_and_macs_can_be_asked_for_their_length) {
  const bytes message = {'a', 'b', 'c'};
  TEE_OperationHandle digest = operation(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0, nullptr);
  TEE_OperationHandle macs[2];  // on one key, which must not share a running computation
  for (auto& mac : macs) {
    mac = operation(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256,
                    secret_key(TEE_TYPE_HMAC_SHA256, {'k', 'e', 'y'}));
  }
  const auto check = [](auto call, TEE_OperationHandle op, const bytes& rest, const char* result) {
    size_t length = 31;
    bytes out(32);
    EXPECT_EQ(call(op, rest.data(), rest.size(), out.data(), &length), TEE_ERROR_SHORT_BUFFER);
    EXPECT_EQ(length, 32U);
    EXPECT_EQ(call(op, rest.data(), rest.size(), out.data(), &length), TEE_SUCCESS);
    EXPECT_EQ(out, hex(result));
  };
  for (int round = 0; round < 2; ++round) {
    TEE_DigestUpdate(digest, message.data(), 1);
    check(TEE_DigestDoFinal, digest, {'b', 'c'},
          "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
    for (auto mac : macs)
      TEE_MACInit(mac, nullptr, 0);
    for (auto mac : macs)
      TEE_MACUpdate(mac, message.data(), 1);
    for (auto mac : macs) {  // of the openssl command
      check(TEE_MACComputeFinal, mac, {'b', 'c'},
            "9c196e32dc0175f86f4b1cb89289d6619de6bee699e4c378e68309ed97a1a6ab");
    }
  }
  TEE_FreeOperation(digest);
  for (auto mac : macs)
    TEE_FreeOperation(mac);
}

// The destination at every distance from the source, with and without bytes held from before; and
// each update is asked for its length first.
TEST_F(symmetric, cipher_buffers_may_overlap) {
  constexpr ptrdiff_t REACH = 20;
  for (uint32_t algorithm : {TEE_ALG_AES_ECB_NOPAD, TEE_ALG_AES_CBC_NOPAD, TEE_ALG_AES_CTR}) {
    const bytes iv(algorithm == TEE_ALG_AES_ECB_NOPAD ? 0 : 16, 9);
    const bytes plain(48, 0x3C);
    TEE_OperationHandle op =
        operation(algorithm, TEE_MODE_ENCRYPT, 128, secret_key(TEE_TYPE_AES, bytes(16, 5)));
    const auto run = [&](size_t held, ptrdiff_t distance) {
      TEE_CipherInit(op, iv.data(), iv.size());
      bytes result(16);
      size_t length = result.size();
      EXPECT_EQ(TEE_CipherUpdate(op, plain.data(), held, result.data(), &length), TEE_SUCCESS);
      result.resize(length);
      bytes room(plain.size() + 2 * REACH);
      uint8_t* source = room.data() + REACH;
      std::copy(plain.begin() + static_cast<ptrdiff_t>(held), plain.end(), source);
      length = 0;
      EXPECT_EQ(TEE_CipherUpdate(op, source, plain.size() - held, nullptr, &length),
                TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, plain.size() - result.size());
      EXPECT_EQ(TEE_CipherUpdate(op, source, plain.size() - held, source + distance, &length),
                TEE_SUCCESS);
      result.insert(result.end(), source + distance, source + distance + length);
      EXPECT_EQ(TEE_CipherDoFinal(op, nullptr, 0, nullptr, &(length = 0)), TEE_SUCCESS);
      return result;
    };
    const bytes expected = run(0, 0);
    EXPECT_NE(expected, plain);
    for (size_t held : {size_t{0}, size_t{5}}) {
      for (ptrdiff_t distance = -REACH; distance <= REACH; ++distance)
        EXPECT_EQ(run(held, distance), expected) << distance;
    }
    TEE_FreeOperation(op);
  }
}

// D. McGrew, J. Viega: The Galois/Counter Mode of Operation, test cases 4 and 5, whose nonce is of
// another length.
struct gcm_case {
  bytes nonce, associated, ciphertext, tag;
};
const gcm_case GCM[] = {
    {hex("cafebabefacedbaddecaf888"), hex("feedfacedeadbeeffeedfacedeadbeefabaddad2"),
     hex("42831ec2217774244b7221b784d0d49ce3aa212f2c02a4e035c17e2329aca12e"
         "21d514b25466931c7d8f6a5aac84aa051ba30b396a0aac973d58e091"),
     hex("5bc94fbc3221a5db94fae95ae7121a47")},
    {hex("cafebabefacedbad"), hex("feedfacedeadbeeffeedfacedeadbeefabaddad2"),
     hex("61353b4c2806934a777ff51fa22a4755699b2a714fcdc6f83766e5f97b6c7423"
         "73806900e49f24b22b097544d4896b424989b5e1ebac0f07c23f4598"),
     hex("3612d2e79e3b0785561be14aaca2fccb")},
};

class gcm : public in_instance {
 protected:
  static TEE_OperationHandle begin(uint32_t mode) {
    return operation(TEE_ALG_AES_GCM, mode, 128,
                     secret_key(TEE_TYPE_AES, hex("feffe9928665731c6d6a8f9467308308")));
  }
  static void start(TEE_OperationHandle op, const gcm_case& message, uint32_t tag_bits = 128) {
    ASSERT_EQ(TEE_AEInit(op, message.nonce.data(), message.nonce.size(), tag_bits, 0, 0),
              TEE_SUCCESS);
    TEE_AEUpdateAAD(op, message.associated.data(), message.associated.size());
  }
};

TEST_F(gcm, tags_of_every_length) {
  TEE_OperationHandle op = begin(TEE_MODE_ENCRYPT);
  for (const gcm_case& message : GCM) {
    for (uint32_t bits = 0; bits <= 136; ++bits) {
      if (bits < 96 || bits > 128 || bits % 8 != 0) {
        EXPECT_EQ(TEE_AEInit(op, message.nonce.data(), 12, bits, 0, 0), TEE_ERROR_NOT_SUPPORTED);
        continue;
      }
      start(op, message, bits);
      bytes output(PLAIN.size());
      size_t length = 0;
      bytes tag(bits / 8);
      size_t tag_length = tag.size() - 1;
      const auto final = [&] {
        return TEE_AEEncryptFinal(op, PLAIN.data(), PLAIN.size(), output.data(), &length,
                                  tag.data(), &tag_length);
      };
      EXPECT_EQ(final(), TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, PLAIN.size());
      EXPECT_EQ(tag_length, tag.size());
      EXPECT_EQ(final(), TEE_SUCCESS);
      EXPECT_EQ(output, message.ciphertext);
      EXPECT_TRUE(std::equal(tag.begin(), tag.end(), message.tag.begin())) << bits;
    }
  }
  EXPECT_EQ(TEE_AEInit(op, nullptr, 0, 128, 0, 0), TEE_ERROR_NOT_SUPPORTED);
  // A message longer than the algorithm allows is refused before a byte of it is read.
  start(op, GCM[0]);
  uint8_t byte = 0;
  size_t length = (size_t{1} << 36) - 31;
  EXPECT_EQ(TEE_AEUpdate(op, &byte, length, &byte, &length), TEE_ERROR_EXCESS_DATA);
  EXPECT_EQ(TEE_AEUpdate(op, &byte, 1, &byte, &(length = 1)), TEE_SUCCESS);
  TEE_FreeOperation(op);
}

}  // namespace
}  // namespace tee::test
