// Parameter sets in malformed bytes, and the tables of names.
#include "keymaster/client/param_set.h"

#include <gtest/gtest.h>

#include "keymaster/client/names.h"
#include "keymaster/client/status.h"

namespace keymaster::client {
namespace {

TEST(ParamSet, RefusesMalformedBytes) {
  const char* cases[] = {
      "",
      "000000",
      "0000000000",                                        // bytes left over
      "01000000",                                          // count without entry
      "ffffffff0200001000000000000000000000000000000000",  // absurd count
      "01000000020000100000000000000000000000000000000000"
      "0000",                                                      // 26 bytes: 2 left over
      "010000005902009000000000000000000000000001000000ffffffff",  // data missing
      "0100000059020090000000000000000000000000ffffffff00000000"
      "78",  // data too long
  };
  for (const char* hex : cases)
    EXPECT_THROW(param_set::parse(from_hex(hex)), format_error) << hex;
}

TEST(ParamSet, HoldsWhatItsTagsCan) {
  EXPECT_THROW(param_set().add(KM_TAG_KEY_SIZE, uint64_t{1} << 32), std::invalid_argument);
  EXPECT_THROW(param_set().add(KM_TAG_APPLICATION_ID, 1), std::invalid_argument);
  EXPECT_THROW(param_set().add_bytes(KM_TAG_KEY_SIZE, {}), std::invalid_argument);
  // A writer may have left something in the upper half of a number of 32 bits.
  EXPECT_EQ(param_set::parse(from_hex("010000000300003000000000000100000a0000000000000000000000")),
            param_set().add(KM_TAG_KEY_SIZE, 256));
}

TEST(Bytes, FailedReadsMoveNothing) {
  const bytes cut = from_hex("05000000aabbccdd");
  field_reader in(cut);
  EXPECT_THROW(in.field(), format_error);
  EXPECT_EQ(in.left(), cut.size());
  EXPECT_THROW(from_hex("abc"), std::invalid_argument);
}

TEST(Names, ParseWhatPeopleWrite) {
  const std::tuple<keymaster_tag_t, const char*, std::optional<uint32_t>> cases[] = {
      {KM_TAG_DIGEST, "sha256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "SHA-256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "KM_DIGEST_SHA_2_256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "4", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "gcm", std::nullopt},
      {KM_TAG_DIGEST, "", std::nullopt},
      {KM_TAG_DIGEST, "0x100000000", std::nullopt},
      {KM_TAG_PADDING, "pkcs1-sign", KM_PAD_RSA_PKCS1_1_5_SIGN},
      {KM_TAG_USER_AUTH_TYPE, "fingerprint", KM_AUTH_TYPE_FINGERPRINT},
  };
  for (const auto& [tag, text, value] : cases)
    EXPECT_EQ(parse_value(tag, text), value) << text;

  for (const char* text : {"KEY_SIZE", "key-size", "KM_TAG_KEY_SIZE", "0x30000003"})
    EXPECT_EQ(parse_tag(text), KM_TAG_KEY_SIZE) << text;
  EXPECT_EQ(parse_tag("no_such_tag"), std::nullopt);
  EXPECT_EQ(value_name(KM_TAG_USER_AUTH_TYPE, 3), "password,fingerprint");
  EXPECT_EQ(value_name(KM_TAG_USER_AUTH_TYPE, 7), "7");
  EXPECT_EQ(value_name(KM_TAG_DIGEST, 99), "99");
  EXPECT_EQ(tag_name(0x30001234), "0x30001234");
}

}  // namespace
}  // namespace keymaster::client
