// Parameter sets against bytes that were written by hand, and the tables of names.
#include "client/param_set.h"

#include <gtest/gtest.h>

#include "client/names.h"
#include "client/status.h"

namespace keymaster::client {
namespace {

struct marshalled_case {
  const char* what;
  param_set set;
  const char* hex;
};

param_set set_of(keymaster_tag_t tag, uint64_t number) {
  return param_set().add(tag, number);
}

TEST(ParamSet, MarshalsAndParsesHandWrittenBytes) {
  const marshalled_case cases[] = {
      {"empty", {}, "00000000"},
      {"integer, all bits", set_of(KM_TAG_OS_VERSION, 0xFFFFFFFF),
       "01000000"
       "c102003000000000"
       "ffffffff000000000000000000000000"},
      {"boolean, data, empty data, in this order",
       param_set()
           .add_flag(KM_TAG_NO_AUTH_REQUIRED)
           .add_bytes(KM_TAG_APPLICATION_ID, as_bytes("abc"))
           .add_bytes(KM_TAG_NONCE, {}),
       "03000000"
       "f701007000000000"
       "01000000000000000000000000000000"
       "5902009000000000"
       "00000000000000000300000000000000"
       "616263"
       "e903009000000000"
       "00000000000000000000000000000000"},
  };
  for (const marshalled_case& c : cases) {
    EXPECT_EQ(to_hex(c.set.marshal()), c.hex) << c.what;
    EXPECT_EQ(param_set::parse(from_hex(c.hex)), c.set) << c.what;
  }
}

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
  for (const char* hex : cases) {
    EXPECT_THROW(param_set::parse(from_hex(hex)), format_error) << hex;
  }
}

TEST(Names, ParseWhatPeopleWrite) {
  struct {
    keymaster_tag_t tag;
    const char* text;
    std::optional<uint32_t> value;
  } cases[] = {
      {KM_TAG_DIGEST, "sha256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "SHA-256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "KM_DIGEST_SHA_2_256", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "4", KM_DIGEST_SHA_2_256},
      {KM_TAG_DIGEST, "gcm", std::nullopt},
      {KM_TAG_DIGEST, "", std::nullopt},
      {KM_TAG_DIGEST, "0x100000000", std::nullopt},
      {KM_TAG_BLOCK_MODE, "GCM", KM_MODE_GCM},
      {KM_TAG_PADDING, "pkcs1-sign", KM_PAD_RSA_PKCS1_1_5_SIGN},
      {KM_TAG_USER_AUTH_TYPE, "fingerprint", KM_AUTH_TYPE_FINGERPRINT},
  };
  for (const auto& c : cases)
    EXPECT_EQ(parse_value(c.tag, c.text), c.value) << c.text;

  for (const char* text : {"KEY_SIZE", "key-size", "KM_TAG_KEY_SIZE", "0x30000003"}) {
    EXPECT_EQ(parse_tag(text), KM_TAG_KEY_SIZE) << text;
  }
  EXPECT_EQ(parse_tag("no_such_tag"), std::nullopt);
  EXPECT_EQ(value_name(KM_TAG_USER_AUTH_TYPE, 3), "password,fingerprint");
  EXPECT_EQ(value_name(KM_TAG_USER_AUTH_TYPE, 7), "7");
  EXPECT_EQ(value_name(KM_TAG_DIGEST, 99), "99");
  EXPECT_EQ(tag_name(0x30001234), "0x30001234");
}

TEST(Names, Dates) {
  EXPECT_EQ(parse_date("1970-01-02"), 86400000u);
  EXPECT_EQ(parse_date("2026-11-22T12:34:56Z"), 1795350896000u);
  EXPECT_EQ(parse_date("12345"), 12345u);
  for (const char* text : {"2026-02-30", "2026-13-01", "1969-12-31", "2026-11-22T12:34", "soon"}) {
    EXPECT_EQ(parse_date(text), std::nullopt) << text;
  }
  EXPECT_EQ(format_date(1795350896007), "2026-11-22T12:34:56.007Z");
  EXPECT_EQ(format_date(UINT64_MAX), "18446744073709551615");
}

TEST(Status, NamesEveryCodeThatFailed) {
  EXPECT_EQ((status{0, 4, -33}.text()), "KM_ERROR_INVALID_KEY_BLOB (-33)");
  EXPECT_EQ((status{0xFFFF0000, 4, 0}.text()),
            "TEE_ERROR_GENERIC (0xffff0000) from the trusted application");
  EXPECT_EQ((status{0xFFFF1234, 3, -7777}.text()),
            "unknown Keymaster error (-7777), unknown TEE error (0xffff1234) from the TEE");
  EXPECT_FALSE((status{0, 4, KM_AUTHENTICATION_DUE}.ok()));
}

}  // namespace
}  // namespace keymaster::client
