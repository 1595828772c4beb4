// MACs and ciphers in what no trusted application of ours asks for: queries, overlapping buffers,
// tags of every length. That the values are the published ones is shown at the command level.
#include <algorithm>
#include <map>

#include "support.h"

namespace tee::test {
namespace {

using symmetric = in_instance;

// A query of the length takes nothing in. Two operations on one key share no running computation,
// and the second round finds them fresh.
TEST_F(symmetric, macs_can_be_asked_for_their_length) {
  // printf abc | openssl mac -digest SHA256 -macopt key:key HMAC
  const bytes expected = {0x9c, 0x19, 0x6e, 0x32, 0xdc, 0x01, 0x75, 0xf8, 0x6f, 0x4b, 0x1c,
                          0xb8, 0x92, 0x89, 0xd6, 0x61, 0x9d, 0xe6, 0xbe, 0xe6, 0x99, 0xe4,
                          0xc3, 0x78, 0xe6, 0x83, 0x09, 0xed, 0x97, 0xa1, 0xa6, 0xab};
  TEE_OperationHandle macs[2];
  for (auto& mac : macs) {
    mac = operation(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256,
                    secret_key(TEE_TYPE_HMAC_SHA256, {'k', 'e', 'y'}));
  }
  for (int round = 0; round < 2; ++round) {
    for (auto mac : macs)
      TEE_MACInit(mac, nullptr, 0);
    for (auto mac : macs)
      TEE_MACUpdate(mac, "a", 1);
    for (auto mac : macs) {
      size_t length = 31;
      bytes out(32);
      EXPECT_EQ(TEE_MACComputeFinal(mac, "bc", 2, out.data(), &length), TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, 32U);
      EXPECT_EQ(TEE_MACComputeFinal(mac, "bc", 2, out.data(), &length), TEE_SUCCESS);
      EXPECT_EQ(out, expected);
    }
  }
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
      bytes result(16);
      size_t length = result.size();
      // A message that is given up leaves nothing to the next one.
      TEE_CipherInit(op, iv.data(), iv.size());
      EXPECT_EQ(TEE_CipherUpdate(op, plain.data(), 3, result.data(), &length), TEE_SUCCESS);
      TEE_CipherInit(op, iv.data(), iv.size());
      length = result.size();
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

// A tag of fewer bits is the front of the whole one; a query of the lengths takes nothing in.
TEST_F(symmetric, gcm_tags_of_every_length) {
  const bytes nonce(12, 7);
  const bytes plain(60, 0x3C);
  auto op = operation(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 128, secret_key(TEE_TYPE_AES, bytes(16)));
  bytes whole;
  for (uint32_t bits = 136; bits <= 136; --bits) {
    const TEE_Result result = TEE_AEInit(op, nonce.data(), nonce.size(), bits, 0, 0);
    if (bits < 96 || bits > 128 || bits % 8 != 0) {
      EXPECT_EQ(result, TEE_ERROR_NOT_SUPPORTED) << bits;
      continue;
    }
    bytes output(plain.size());
    bytes tag(bits / 8);
    size_t length = 0;
    size_t tag_length = tag.size() - 1;
    const auto final = [&] {
      return TEE_AEEncryptFinal(op, plain.data(), plain.size(), output.data(), &length, tag.data(),
                                &tag_length);
    };
    EXPECT_EQ(final(), TEE_ERROR_SHORT_BUFFER);
    EXPECT_EQ(length, plain.size());
    EXPECT_EQ(tag_length, tag.size());
    EXPECT_EQ(final(), TEE_SUCCESS);
    if (bits == 128) whole = tag;
    EXPECT_TRUE(std::equal(tag.begin(), tag.end(), whole.begin())) << bits;
  }
  // A message longer than the algorithm allows is refused before a byte of it is read.
  ASSERT_EQ(TEE_AEInit(op, nonce.data(), nonce.size(), 128, 0, 0), TEE_SUCCESS);
  uint8_t byte = 0;
  if (auto too_long = (uint64_t{1} << 36) - 31; too_long <= SIZE_MAX) {
    auto length = static_cast<size_t>(too_long);
    EXPECT_EQ(TEE_AEUpdate(op, &byte, length, &byte, &length), TEE_ERROR_EXCESS_DATA);
  }
  TEE_FreeOperation(op);
}

// Nonces of every length count as a whole, one after the other and in operations that share a key;
// and what opens under a wrong tag, or one that is cut short, is not seen.
TEST_F(symmetric, gcm_nonces_and_tags_count_as_a_whole) {
  const bytes nonce(20, 7);
  const bytes plain(20, 0x3C);
  const auto prepared = [&](uint32_t mode, size_t nonce_length) {
    auto op = operation(TEE_ALG_AES_GCM, mode, 128, secret_key(TEE_TYPE_AES, bytes(16, 9)));
    EXPECT_EQ(TEE_AEInit(op, nonce.data(), nonce_length, 128, 0, 0), TEE_SUCCESS);
    return op;
  };
  std::map<size_t, bytes> sealed;
  for (size_t nonce_length : {12, 8, 16, 12, 1, 20, 12, 16, 8}) {
    auto op = prepared(TEE_MODE_ENCRYPT, nonce_length);
    bytes made(36);
    size_t length = 20, tag_length = 16;
    EXPECT_EQ(
        TEE_AEEncryptFinal(op, plain.data(), 20, made.data(), &length, &made[20], &tag_length),
        TEE_SUCCESS);
    EXPECT_EQ(sealed.try_emplace(nonce_length, made).first->second, made) << nonce_length;
    TEE_FreeOperation(op);
    for (size_t other : {8, 12, 16}) {
      EXPECT_EQ(sealed.contains(other) && sealed[other] == made, other == nonce_length);
    }
  }
  for (size_t tag_length : {12, 15, 16}) {
    auto op = prepared(TEE_MODE_DECRYPT, 12);
    bytes input = sealed[12];
    if (tag_length == 16) input.back() ^= 1;
    bytes opened(20, 0xEE);
    size_t length = opened.size();
    EXPECT_EQ(
        TEE_AEDecryptFinal(op, input.data(), 20, opened.data(), &length, &input[20], tag_length),
        TEE_ERROR_MAC_INVALID);
    EXPECT_EQ(length, 0U);
    EXPECT_EQ(opened, bytes(20));
    TEE_FreeOperation(op);
  }
}

}  // namespace
}  // namespace tee::test
