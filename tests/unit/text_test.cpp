// The texts of SOTER documents: JSON byte by byte, UTF-8 by what must not pass, base64 by the
// vectors of RFC 4648 and the lines of PEM.
#include <gtest/gtest.h>
#include <limits>
#include <string>

#include "platform.h"
#include "soter/base64.h"
#include "soter/json.h"
#include "soter/utf8.h"

namespace keymaster {
namespace {

using namespace std::string_literals;

byte_view bytes_of(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

std::string text_of(byte_view bytes) {
  return {bytes.begin(), bytes.end()};
}

class Text : public testing::Test {
 protected:
  void SetUp() override { platform::reset(); }
  void TearDown() override {
    EXPECT_EQ(platform::live_blocks, 0U);
    EXPECT_EQ(platform::unwiped_blocks, 0U);
  }
};

// The text of a value without its zero byte, which must be there and be counted.
std::string written(const json_value& value) {
  heap_buffer text;
  EXPECT_TRUE(json_serialize(value, &text));
  EXPECT_EQ(text.size(), json_text_size(value));
  const std::string result = text_of(text.view());
  EXPECT_TRUE(!result.empty() && result.back() == '\0');
  return result.substr(0, result.size() - 1);
}

json_value string_value(std::string_view text) {
  json_value value;
  EXPECT_TRUE(value.make_string(bytes_of(text)));
  return value;
}

TEST_F(Text, JsonStrings) {
  const struct {
    std::string text, written;
  } rows[] = {
      {"", R"("")"},
      {"/", R"("\/")"},
      {"\"\\/\b\f\n\r\t", R"("\"\\\/\b\f\n\r\t")"},
      {"a/b//", R"("a\/b\/\/")"},
      {"\x01\x0b\x1f\x7f", "\"\x01\x0b\x1f\x7f\""},
      {"\xc3\xa9\xf0\x9f\x94\x91", "\"\xc3\xa9\xf0\x9f\x94\x91\""},
      {"\xff\xc0 as it is", "\"\xff\xc0 as it is\""},
      {"to here\0not\n"s, R"("to here")"},
  };
  for (const auto& row : rows)
    EXPECT_EQ(written(string_value(row.text)), row.written);
}

TEST_F(Text, JsonNumbers) {
  using limits = std::numeric_limits<double>;
  const struct {
    double number;
    const char* written;
  } rows[] = {
      {0, "0"},
      {-0.0, "0"},
      {7, "7"},
      {-1, "-1"},
      {1.5, "1.500000"},
      {-0.25, "-0.250000"},
      {1e-7, "0.000000"},
      {4294967295.0, "4294967295"},
      {9007199254740992.0, "9007199254740992"},
      {9223372036854774784.0, "9223372036854774784"},  // the last double below 2^63
      {-9223372036854775808.0, "-9223372036854775808"},
      {9223372036854775808.0, "9223372036854775808.000000"},
      {-9223372036854777856.0, "-9223372036854777856.000000"},
      {18446744073709551615.0, "18446744073709551616.000000"},
      {1e28, "9999999999999999583119736832."},  // 29 characters and no more
      {limits::infinity(), "inf"},
      {limits::quiet_NaN(), "nan"},
  };
  for (const auto& row : rows)
    EXPECT_EQ(written(json_value(row.number)), row.written);
}

// Builds and writes a document; counts on each step to be whole or not done at all.
bool build(std::string* text) {
  json_value root;
  if (!root.make_object()) return false;
  json_list* members = root.object();
  bool done = json_set_number(members, "n", 1) == 0;
  done = json_set_string(members, "s", bytes_of("long enough to hold")) == 0 && done;
  done = json_set_string(members, "s", bytes_of("another value")) == 0 && done;
  heap_buffer made;
  done = json_serialize(root, &made) && done;
  *text = text_of(made.view());
  return done;
}

TEST_F(Text, JsonWithoutMemory) {
  std::string text;
  ASSERT_TRUE(build(&text));
  const std::string whole = text;
  bool failed = true;
  for (int n = 1; failed; n++) {
    platform::allocations_to_fail = n;
    const bool done = build(&text);
    failed = platform::allocations_to_fail == 0;
    platform::allocations_to_fail = 0;
    EXPECT_EQ(done, !failed) << n;
  }
  EXPECT_EQ(text, whole);
  EXPECT_EQ(text, "{\"n\":1,\"s\":\"another value\"}\0"s);
}

TEST_F(Text, Utf8) {
  const struct {
    std::string text;
    bool valid;
  } rows[] = {
      {"", true},
      {"plain\x7f", true},
      {"a\0b"s, true},
      {"\xc2\x80\xdf\xbf", true},
      {"\xe0\xa0\x80\xed\x9f\xbf\xee\x80\x80\xef\xbf\xbf", true},
      {"\xf0\x90\x80\x80\xf4\x8f\xbf\xbf", true},
      {"\x80", false},              // a continuation byte in front
      {"\xbf", false},              //
      {"\xc0\x80", false},          // overlong: two bytes,
      {"\xc1\xbf", false},          //
      {"\xe0\x80\x80", false},      // three,
      {"\xe0\x9f\xbf", false},      //
      {"\xf0\x80\x80\x80", false},  // four
      {"\xf0\x8f\xbf\xbf", false},  //
      {"\xed\xa0\x80", false},      // surrogates
      {"\xed\xbf\xbf", false},      //
      {"\xf4\x90\x80\x80", false},  // behind the last code point
      {"\xf5\x80\x80\x80", false},  //
      {"\xff", false},              //
      {"\xc3", false},              // cut off
      {"\xe2\x82", false},          //
      {"\xf0\x9f\x94", false},      //
      {"\xc3(", false},             // not continued
      {"\xe2\x82z", false},         //
      {"\xf0\x9f\x94\xc0", false},  //
      {"ok \xc3\xa9 \xe2(\xa1", false},
  };
  for (const auto& row : rows)
    EXPECT_EQ(is_valid_utf8(bytes_of(row.text)), row.valid) << testing::PrintToString(row.text);
}

TEST_F(Text, Base64) {
  const std::string line(64, 'A');
  const struct {
    std::string data, text;
  } rows[] = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"foob", "Zm9vYg=="},
      {"fooba", "Zm9vYmE="},
      {"foobar", "Zm9vYmFy"},
      {"\xfb\xef\xbe\xff\xff\xff", "++++////"},
      {std::string(47, '\0'), std::string(63, 'A') + "="},
      {std::string(48, '\0'), line},
      {std::string(49, '\0'), line + "\nAA=="},
      {std::string(96, '\0'), line + "\n" + line},
      {std::string(97, '\0'), line + "\n" + line + "\nAA=="},
  };
  for (const auto& row : rows) {
    heap_buffer text;
    ASSERT_TRUE(base64_encode(bytes_of(row.data), &text));
    EXPECT_EQ(text_of(text.view()), row.text);
    platform::allocations_to_fail = 1;
    EXPECT_FALSE(base64_encode(bytes_of(row.data), &text));
    EXPECT_FALSE(text);
  }
}

}  // namespace
}  // namespace keymaster
