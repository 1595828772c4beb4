// HMAC keys and operations: published MACs through import and sign, and what is refused.
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::to_hex;
using namespace std::string_literals;

// RFC 2202 (SHA-1) and RFC 4231 (SHA-2) with keys of one repeated byte. The last two, whose keys
// fill a block and exceed it, were computed with the openssl command.
const struct {
  uint8_t key_byte;
  size_t key_size;
  const char* data;
  uint32_t digest;
  const char* mac;
} VECTORS[] = {
    {0x0b, 20, "Hi There", 2, "b617318655057264e28bc0b6fb378c8ef146be00"},
    {0xaa, 80, "Test Using Larger Than Block-Size Key - Hash Key First", 2,
     "aa4ae5e15272d00e95705637ce8a3b55ed402112"},
    {0x0b, 20, "Hi There", 3, "896fb1128abbdf196832107cd49df33f47b4b1169912ba4f53684b22"},
    {0x0b, 20, "Hi There", 4, "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7"},
    {0x0b, 20, "Hi There", 5,
     "afd03944d84895626b0825f4ab46907f15f9dadbe4101ec682aa034c7cebc59cfaea9ea9076ede7f4af152e8b2"
     "fa9cb6"},
    {0x0b, 20, "Hi There", 6,
     "87aa7cdea5ef619d4ff0b4241a1d6cb02379f4e2ce4ec2787ad0b30545e17cdedaa833b7d6b8a702038b274eae"
     "a3f4e4be9d914eeb61f1702e696c203a126854"},
    {0x0c, 20, "Test With Truncation", 4, "a3b6167473100ee06e0c796c2955552b"},
    {0x0c, 64, "Hi There", 4, "423db8a45c2a4db49b0fcc25fcc79357abfc09a58820579959a57e9c7611ecf0"},
    {0xaa, 100, "Hi There", 4, "4e9638590f2780370491dacfd8e20c85600da0ded385d8b4f68b00425d4518f2"},
};

class Hmac : public testing::Test {
 protected:
  ta_under_test ta;
  const bytes blob = ta.import(hmac_key(), bytes(20, 0x0b));
};

TEST_F(Hmac, ComputesPublishedMacsAndForgetsTheKeys) {
  for (const auto& v : VECTORS) {
    const bytes key(v.key_size, v.key_byte);
    ta.watch_secret(key);
    const bytes its_blob = ta.import(hmac_key(0, v.digest), key);
    const auto bits = static_cast<uint32_t>(4 * std::string_view(v.mac).size());
    EXPECT_EQ(to_hex(ta.run(SIGN, its_blob, mac_use(bits, v.digest), as_bytes(v.data))), v.mac);
  }
}

TEST_F(Hmac, TakesDataInAnyPiecesAndNothingAtFinish) {
  const byte_view data = as_bytes("Hi There");
  for (size_t cut = 0; cut <= data.size(); cut++) {
    const uint32_t handle = ta.begun(SIGN, blob, mac_use());
    EXPECT_EQ(ta.update(handle, data.first(cut)).b, cut);
    EXPECT_EQ(ta.update(handle, data.subspan(cut)).output_size, 0u);
    const reply done = ta.finish(handle, as_bytes("finish's input is not part of the MAC"));
    EXPECT_EQ(to_hex(done.output()), std::string("20000000") + VECTORS[3].mac + "0400000000000000");
  }
  // All of it given to finish alone: the MAC of the empty message.
  EXPECT_EQ(to_hex(ta.finish(ta.begun(SIGN, blob, mac_use()), data).output()),
            "20000000999a901219f032cd497cadb5e6051e97b6a29ab297bd6ae722bd6062a2f59542"
            "0400000000000000");
}

TEST_F(Hmac, MacLengthIsMeasuredAtTheEnd) {
  for (const auto& [bits, length] : {std::pair(64u, 8u), {100, 12}, {256, 32}}) {  // whole bytes
    EXPECT_EQ(ta.run(SIGN, blob, mac_use(bits), {}).size(), length);
  }
  for (const auto& [bits, need] : {std::pair(264u, "33"), {0xFFFFFFFF, "536870911"}}) {
    const reply done = ta.try_run(SIGN, blob, mac_use(bits), {});
    EXPECT_TRUE(refused(done, KM_ERROR_UNKNOWN_ERROR)) << bits;
    EXPECT_EQ(done.output_size, 0u);
    EXPECT_EQ(ta.trace().errors(),
              "hmac_sign_finish: Too short output of HMAC operation, expect at least "s + need +
                  "B, got 32B | finish: Finish failed");
  }
}

// Verification can be begun and fed; it never succeeds.
TEST_F(Hmac, VerifyAlwaysEndsOutOfMemory) {
  const bytes mac = ta.run(SIGN, blob, mac_use(128), as_bytes("data"));
  EXPECT_TRUE(refused(ta.try_run(VERIFY, blob, mac_use(128), as_bytes("data"), mac),
                      KM_ERROR_MEMORY_ALLOCATION_FAILED));
  EXPECT_TRUE(ta.trace().has("hmac_verify_finish: Out of memory, need 16B"));
}

TEST_F(Hmac, RefusesDescriptionsInOrder) {
  const param_set good = hmac_key(256);
  const std::string no_size = "No or too many KM_TAG_KEY_SIZE or specified";
  const std::string no_minimum = "No or too many KM_TAG_MIN_MAC_LENGTH or specified";
  const bad_key keys[] = {
      {with(good, KM_TAG_MIN_MAC_LENGTH, {56}).add(KM_TAG_ORIGIN, 0), -38,
       "Shouldn't specify KM_TAG_ORIGIN"},
      {with(good, KM_TAG_OS_VERSION, {1}), -38, "Shouldn't specify KM_TAG_OS_VERSION"},
      {with(good, KM_TAG_OS_PATCHLEVEL, {1}), -38, "Shouldn't specify KM_TAG_OS_PATCHLEVEL"},
      {with(good, KM_TAG_CREATION_DATETIME, {1}), -38,
       "Shouldn't specify KM_TAG_CREATION_DATETIME"},
      {hmac_key(), -38, no_size},
      {with(good, KM_TAG_KEY_SIZE, {256, 256}), -38, no_size},
      {with(good, KM_TAG_KEY_SIZE, {0}), -6, "Invalid hmac key size 0"},
      {with(good, KM_TAG_KEY_SIZE, {12}), -6, "Invalid hmac key size 12"},
      {with(good, KM_TAG_KEY_SIZE, {1032}), -6, "Invalid hmac key size 1032"},
      {without(good, KM_TAG_MIN_MAC_LENGTH), -38, no_minimum},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {64, 64}), -38, no_minimum},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {56}), -59, "Invalid KM_TAG_MIN_MAC_LENGTH 56"},
      {with(good, KM_TAG_MIN_MAC_LENGTH, {129}), -59, "Invalid KM_TAG_MIN_MAC_LENGTH 129"},
      {without(good, KM_TAG_DIGEST), -12, "No or too many KM_TAG_DIGEST"},
      {with(good, KM_TAG_DIGEST, {4, 4}), -12, "No or too many KM_TAG_DIGEST"},
      {with(good, KM_TAG_DIGEST, {KM_DIGEST_NONE}), -12, ""},
      {with(good, KM_TAG_DIGEST, {KM_DIGEST_MD5}), -12, ""},
      {with(good, KM_TAG_DIGEST, {UNKNOWN_DIGEST}), -12, ""},
      {hmac_key(128), -44, "Key size mismatch (given 128, guessed 160)", bytes(20)},
      {hmac_key(), -6, "Invalid hmac key size 0", bytes()},
      {hmac_key(), -6, "Invalid hmac key size 1032", bytes(129)},
  };
  ta.expect_refused_keys("hmac_", keys);
  // A repeated size counts as absent when a key is imported, and one more is added.
  const bytes sized = ta.import(hmac_key(128).add(KM_TAG_KEY_SIZE, 128), bytes(20, 1));
  EXPECT_EQ(ta.characteristics(sized).numbers(KM_TAG_KEY_SIZE),
            (std::vector<uint64_t>{128, 128, 160}));
}

// The largest minimum that each digest reaches, and 8 bits more.
TEST_F(Hmac, MinimumMacLengthEndsAtTheDigests) {
  for (const auto& [digest, bits] : {std::pair{2u, 160u}, {3, 224}, {4, 256}, {5, 384}, {6, 512}}) {
    const param_set key = hmac_key(1024, digest);
    const bytes its_blob = ta.generate(with(key, KM_TAG_MIN_MAC_LENGTH, {bits}));
    EXPECT_EQ(ta.run(SIGN, its_blob, mac_use(bits, digest), {}).size(), bits / 8);
    ta.expect_refused(generate_request(with(key, KM_TAG_MIN_MAC_LENGTH, {bits + 8})), -59);
  }
}

}  // namespace
}  // namespace keymaster::test
