// HMAC keys and operations: published MACs through import and sign, and what is refused.
#include <gtest/gtest.h>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::from_hex;
using client::to_hex;

struct mac_vector {
  const char* source;
  std::string key;  // hexadecimal
  std::string data;
  uint32_t digest;
  const char* mac;
};

std::string repeat(const char* hex, size_t count) {
  std::string text;
  while (count-- > 0)
    text += hex;
  return text;
}

const std::string HI_THERE = "4869205468657265";
const std::string WHAT = "7768617420646f2079612077616e7420666f72206e6f7468696e673f";
const std::string COUNTING = "0102030405060708090a0b0c0d0e0f10111213141516171819";
const std::string LARGER_KEY =
    "54657374205573696e67204c6172676572205468616e20426c6f636b2d53697a65204b6579202d204861736820"
    "4b6579204669727374";

// RFC 4231 (SHA-2) and RFC 2202 (SHA-1). The last four, at the edges of the block size, were
// computed with the openssl command.
const mac_vector VECTORS[] = {
    {"2202-1", repeat("0b", 20), HI_THERE, KM_DIGEST_SHA1,
     "b617318655057264e28bc0b6fb378c8ef146be00"},
    {"2202-6: key above the block", repeat("aa", 80), LARGER_KEY, KM_DIGEST_SHA1,
     "aa4ae5e15272d00e95705637ce8a3b55ed402112"},
    {"4231-1", repeat("0b", 20), HI_THERE, KM_DIGEST_SHA_2_224,
     "896fb1128abbdf196832107cd49df33f47b4b1169912ba4f53684b22"},
    {"4231-1", repeat("0b", 20), HI_THERE, KM_DIGEST_SHA_2_256,
     "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7"},
    {"4231-1", repeat("0b", 20), HI_THERE, KM_DIGEST_SHA_2_384,
     "afd03944d84895626b0825f4ab46907f15f9dadbe4101ec682aa034c7cebc59cfaea9ea9076ede7f4af152e8b2"
     "fa9cb6"},
    {"4231-1", repeat("0b", 20), HI_THERE, KM_DIGEST_SHA_2_512,
     "87aa7cdea5ef619d4ff0b4241a1d6cb02379f4e2ce4ec2787ad0b30545e17cdedaa833b7d6b8a702038b274eae"
     "a3f4e4be9d914eeb61f1702e696c203a126854"},
    {"4231-2: short key", "4a656665", WHAT, KM_DIGEST_SHA_2_256,
     "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843"},
    {"4231-2: short key", "4a656665", WHAT, KM_DIGEST_SHA_2_512,
     "164b7a7bfcf819e2e395fbe73b56e0a387bd64222e831fd610270cd7ea2505549758bf75c05a994a6d034f65f8"
     "f0e6fdcaeab1a34d4a6b4b636e070a38bce737"},
    {"4231-3", repeat("aa", 20), repeat("dd", 50), KM_DIGEST_SHA_2_224,
     "7fb3cb3588c6c1f6ffa9694d7d6ad2649365b0c1f65d69d1ec8333ea"},
    {"4231-4", COUNTING, repeat("cd", 50), KM_DIGEST_SHA_2_384,
     "3e8a69b7783c25851933ab6290af6ca77a9981480850009cc5577c6e1f573b4e6801dd23c4a7d679ccf8a386c6"
     "74cffb"},
    {"4231-5: truncated to 128 bits", repeat("0c", 20), "546573742057697468205472756e636174696f6e",
     KM_DIGEST_SHA_2_256, "a3b6167473100ee06e0c796c2955552b"},
    {"64 bytes: as it is", repeat("aa", 64), HI_THERE, KM_DIGEST_SHA_2_256,
     "ebef34e13d0a0fe04593d043bc7a865106db0604211d404c18206d862e5d7852"},
    {"65 bytes: hashed", repeat("aa", 65), HI_THERE, KM_DIGEST_SHA_2_256,
     "00af6c42340b99e2e1d9a1cdf1547be431fe2e9bab3215c68d013ba858891927"},
    {"100 bytes: hashed", repeat("aa", 100), HI_THERE, KM_DIGEST_SHA_2_256,
     "4e9638590f2780370491dacfd8e20c85600da0ded385d8b4f68b00425d4518f2"},
    {"128 bytes: as it is", repeat("aa", 128), HI_THERE, KM_DIGEST_SHA_2_512,
     "17eb09b3d3c0f3ac497c608347e1d5b5df5e4b062bfd56c191c8499f24a3a9d1c3dfb449d01f4c9ca316b6b8d6a62"
     "99bad883d0bffe11c88c60d7daed6feeb48"},
};

TEST(Hmac, ComputesPublishedMacsAndForgetsTheKeys) {
  ta_under_test ta;
  for (const mac_vector& v : VECTORS) {
    if (v.key.size() >= 32) ta.watch_secret(from_hex(v.key));
    const bytes blob = ta.import(hmac_key(0, v.digest), from_hex(v.key));
    const auto bits = static_cast<uint32_t>(4 * std::string_view(v.mac).size());
    EXPECT_EQ(to_hex(ta.run(KM_PURPOSE_SIGN, blob, mac_use(bits, v.digest), from_hex(v.data))),
              v.mac)
        << v.source;
  }
}

TEST(Hmac, TakesDataInAnyPiecesAndNothingAtFinish) {
  ta_under_test ta;
  const bytes blob = ta.import(hmac_key(), from_hex(repeat("0b", 20)));
  const bytes data = from_hex(HI_THERE);
  for (size_t cut = 0; cut <= data.size(); cut++) {
    const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, mac_use());
    const reply first = ta.update(handle, byte_view(data).first(cut));
    EXPECT_EQ(first.b, cut);
    EXPECT_TRUE(first.ok() && first.output_size == 0);
    EXPECT_TRUE(succeeded(ta.update(handle, byte_view(data).subspan(cut))));
    const reply done = ta.finish(handle, as_bytes("finish's input is not part of the MAC"));
    EXPECT_EQ(to_hex(done.output()).substr(0, 72),
              "20000000b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7")
        << cut;
  }
  // All of it given to finish alone: the MAC of the empty message.
  const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, mac_use());
  EXPECT_EQ(to_hex(ta.finish(handle, data).output()),
            "20000000999a901219f032cd497cadb5e6051e97b6a29ab297bd6ae722bd6062a2f59542"
            "0400000000000000");
}

TEST(Hmac, MacLengthIsMeasuredAtTheEnd) {
  const struct {
    uint32_t bits;
    size_t length;  // 0: refused
    const char* errors;
  } cases[] = {
      {64, 8, ""},
      {100, 12, ""},  // whole bytes are given
      {256, 32, ""},
      {264, 0,
       "hmac_sign_finish: Too short output of HMAC operation, expect at least 33B, got 32B | "
       "finish: Finish failed"},
      {0xFFFFFFFF, 0,
       "hmac_sign_finish: Too short output of HMAC operation, expect at least 536870911B, got 32B "
       "| finish: Finish failed"},
  };
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  for (const auto& c : cases) {
    const reply done = ta.finish(ta.begun(KM_PURPOSE_SIGN, blob, mac_use(c.bits)));
    if (c.length == 0) {
      EXPECT_TRUE(refused(done, KM_ERROR_UNKNOWN_ERROR)) << c.bits;
    } else {
      EXPECT_EQ(done.output_size, 4 + c.length + 8) << c.bits;
    }
    EXPECT_EQ(ta.trace().errors(), c.errors);
  }
}

// Verification can be begun and fed; it never succeeds.
TEST(Hmac, VerifyAlwaysEndsOutOfMemory) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  const bytes mac = ta.run(KM_PURPOSE_SIGN, blob, mac_use(128), as_bytes("data"));
  const uint32_t handle = ta.begun(KM_PURPOSE_VERIFY, blob, mac_use(128));
  EXPECT_EQ(ta.update(handle, as_bytes("data")).b, 4u);
  EXPECT_TRUE(refused(ta.finish(handle, mac), KM_ERROR_MEMORY_ALLOCATION_FAILED));
  EXPECT_TRUE(ta.trace().has("hmac_verify_finish: Out of memory, need 16B"));
  EXPECT_EQ(ta.live_operations(), 0u);
}

struct key_case {
  const char* what;
  param_set key;
  int32_t error;
  const char* errors;  // without the function; empty: no line
};

TEST(Hmac, RefusesDescriptionsInOrder) {
  const param_set good = hmac_key(256);
  const auto with = [&](keymaster_tag_t tag, uint64_t number) {
    return without(good, tag).append(one(tag, number));
  };
  const auto twice = [&](keymaster_tag_t tag, uint64_t number) {
    return with(tag, number).append(one(tag, number));
  };
  const param_set low_and_wrong = with(KM_TAG_MIN_MAC_LENGTH, 56).append(one(KM_TAG_ORIGIN, 0));
  const key_case cases[] = {
      {"origin first", low_and_wrong, -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {"version", with(KM_TAG_OS_VERSION, 1), -38, "Shouldn't specify KM_TAG_OS_VERSION"},
      {"patch level", with(KM_TAG_OS_PATCHLEVEL, 1), -38, "Shouldn't specify KM_TAG_OS_PATCHLEVEL"},
      {"creation", with(KM_TAG_CREATION_DATETIME, 1), -38,
       "Shouldn't specify KM_TAG_CREATION_DATETIME"},
      {"no size", hmac_key(), -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      {"sizes", twice(KM_TAG_KEY_SIZE, 256), -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      {"size 0", with(KM_TAG_KEY_SIZE, 0), -6, "Invalid hmac key size 0"},
      {"size 12", with(KM_TAG_KEY_SIZE, 12), -6, "Invalid hmac key size 12"},
      {"size 1032", with(KM_TAG_KEY_SIZE, 1032), -6, "Invalid hmac key size 1032"},
      {"no minimum", without(good, KM_TAG_MIN_MAC_LENGTH), -38,
       "No or too many KM_TAG_MIN_MAC_LENGTH or specified"},
      {"minima", twice(KM_TAG_MIN_MAC_LENGTH, 64), -38,
       "No or too many KM_TAG_MIN_MAC_LENGTH or specified"},
      {"minimum 56", with(KM_TAG_MIN_MAC_LENGTH, 56), -59, "Invalid KM_TAG_MIN_MAC_LENGTH 56"},
      {"minimum 129", with(KM_TAG_MIN_MAC_LENGTH, 129), -59, "Invalid KM_TAG_MIN_MAC_LENGTH 129"},
      {"no digest", without(good, KM_TAG_DIGEST), -12, "No or too many KM_TAG_DIGEST"},
      {"digests", twice(KM_TAG_DIGEST, 4), -12, "No or too many KM_TAG_DIGEST"},
      {"digest NONE", with(KM_TAG_DIGEST, KM_DIGEST_NONE), -12, ""},
      {"digest MD5", with(KM_TAG_DIGEST, KM_DIGEST_MD5), -12, ""},
      {"digest 7", with(KM_TAG_DIGEST, 7), -12, ""},
  };
  ta_under_test ta;
  for (const key_case& c : cases) {
    EXPECT_TRUE(refused(ta.send(generate_request(c.key)), c.error)) << c.what;
    const std::string line = c.errors;
    EXPECT_EQ(ta.trace().errors(), line.empty() ? "" : "hmac_generate_key: " + line) << c.what;
  }
}

// The largest minimum that each digest reaches, and 8 bits more.
TEST(Hmac, MinimumMacLengthEndsAtTheDigests) {
  ta_under_test ta;
  for (const auto& [digest, bits] : {std::pair{2u, 160u}, {3, 224}, {4, 256}, {5, 384}, {6, 512}}) {
    const param_set key = without(hmac_key(1024, digest), KM_TAG_MIN_MAC_LENGTH);
    const bytes blob = ta.generate(param_set(key).append(one(KM_TAG_MIN_MAC_LENGTH, bits)));
    EXPECT_EQ(ta.run(KM_PURPOSE_SIGN, blob, mac_use(bits, digest), {}).size(), bits / 8);
    EXPECT_TRUE(refused(
        ta.send(generate_request(param_set(key).append(one(KM_TAG_MIN_MAC_LENGTH, bits + 8)))),
        KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH));
  }
}

TEST(Hmac, ImportTakesItsSizeFromTheData) {
  ta_under_test ta;
  const bytes data(20, 0x11);
  const struct {
    param_set key;
    size_t size;
    int32_t error;
    const char* errors;
  } cases[] = {
      {hmac_key(160), 20, 0, ""},
      {hmac_key(128), 20, -44, "hmac_import_key: Key size mismatch (given 128, guessed 160)"},
      {hmac_key(), 0, -6, "hmac_import_key: Invalid hmac key size 0"},
      {hmac_key(), 129, -6, "hmac_import_key: Invalid hmac key size 1032"},
  };
  for (const auto& c : cases) {
    const reply answer = ta.send(import_request(c.key, bytes(c.size, 0x11)));
    EXPECT_EQ(answer.km_error, c.error);
    EXPECT_EQ(ta.trace().errors(), c.errors);
  }
  // A repeated size counts as absent, and one more is added.
  const bytes blob = ta.import(hmac_key(128).append(one(KM_TAG_KEY_SIZE, 128)), data);
  EXPECT_EQ(ta.characteristics(blob).numbers(KM_TAG_KEY_SIZE),
            (std::vector<uint64_t>{128, 128, 160}));
}

TEST(Hmac, BeginRefusesRequestsAndRecords) {
  ta_under_test ta({.rpmb = false});
  const bytes good = ta.generate(hmac_key(256));
  const param_set made = ta.characteristics(good);
  const bytes key(32, 0x22);
  const bytes unknown_type = seal(blob_plaintext(hmac_material(key, 0xA0000001), made));
  bytes record = hmac_material(key);
  record.pop_back();
  const bytes short_record = seal(blob_plaintext(record, made));
  const struct {
    const bytes& blob;
    param_set use;
    int32_t error;
    const char* errors;
  } cases[] = {
      {good, without(mac_use(), KM_TAG_MAC_LENGTH), -38, "No or too many KM_TAG_MAC_LENGTH"},
      {good, mac_use().append(one(KM_TAG_MAC_LENGTH, 64)), -38, "No or too many KM_TAG_MAC_LENGTH"},
      {unknown_type, mac_use(), -41, "Resolve key data failed"},
      {short_record, mac_use(), -1000, "Resolve key data failed"},
  };
  for (const auto& c : cases) {
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, c.blob, c.use), c.error)) << c.errors;
    EXPECT_TRUE(ta.trace().has(std::string("create_hmac_sign: ") + c.errors))
        << ta.trace().errors();
    EXPECT_TRUE(ta.trace().has("begin: Create operation failed"));
  }
}

}  // namespace
}  // namespace keymaster::test
