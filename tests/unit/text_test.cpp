// The texts of SOTER documents: JSON byte by byte, UTF-8 by what must not pass, base64 by the
// vectors of RFC 4648 and the lines of PEM.
#include <limits>
#include <string>

#include "fixture.h"
#include "ta/soter/base64.h"
#include "ta/soter/json.h"
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

using namespace std::string_literals;

byte_view bytes_of(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

std::string text_of(byte_view bytes) {
  return {bytes.begin(), bytes.end()};
}

using Text = platform::fixture;

// The text of a value without its zero byte, which must be there and be counted.
std::string written(const json_value& value) {
  heap_buffer text;
  EXPECT_TRUE(json_serialize(value, &text));
  EXPECT_EQ(text.size(), json_text_size(value));
  const std::string result = text_of(text.view());
  EXPECT_TRUE(!result.empty() && result.back() == '\0');
  return result.substr(0, result.size() - 1);
}

TEST_F(Text, JsonStrings) {
  const std::pair<std::string, const char*> rows[] = {
      {"\"\\/\b\f\n\r\t", R"("\"\\\/\b\f\n\r\t")"}, {"a/b//", R"("a\/b\/\/")"},
      {"\x01\x0b\x1f\x7f", "\"\x01\x0b\x1f\x7f\""}, {"\xff\xc0 as it is", "\"\xff\xc0 as it is\""},
      {"to here\0not\n"s, R"("to here")"},
  };
  for (const auto& [text, expected] : rows) {
    json_value value;
    EXPECT_TRUE(value.make_string(bytes_of(text)));
    EXPECT_EQ(written(value), expected);
  }
}

TEST_F(Text, JsonNumbers) {
  const std::pair<double, const char*> rows[] = {
      {-0.0, "0"},
      {-1, "-1"},
      {1.5, "1.500000"},
      {1e-7, "0.000000"},
      {9223372036854774784.0, "9223372036854774784"},  // the last double below 2^63
      {-9223372036854775808.0, "-9223372036854775808"},
      {9223372036854775808.0, "9223372036854775808.000000"},
      {-9223372036854777856.0, "-9223372036854777856.000000"},
      {1e28, "9999999999999999583119736832."},  // 29 characters and no more
      {std::numeric_limits<double>::quiet_NaN(), "nan"},
  };
  for (const auto& [number, expected] : rows)
    EXPECT_EQ(written(json_value(number)), expected);
}

// A member that is set again keeps its place.
TEST_F(Text, JsonObjects) {
  json_value root;
  ASSERT_TRUE(root.make_object());
  EXPECT_EQ(json_set_string(root.object(), "s", bytes_of("long enough to hold")), 0);
  EXPECT_EQ(json_set_number(root.object(), "n", 1), 0);
  EXPECT_EQ(json_set_string(root.object(), "s", bytes_of("another value")), 0);
  EXPECT_EQ(written(root), R"({"s":"another value","n":1})");
}

TEST_F(Text, Utf8) {
  const std::pair<std::string, bool> rows[] = {
      {"plain\x7f", true},
      {"a\0b"s, true},
      {"\xc2\x80\xdf\xbf", true},
      {"\xe0\xa0\x80\xed\x9f\xbf\xee\x80\x80\xef\xbf\xbf", true},
      {"\xf0\x90\x80\x80\xf4\x8f\xbf\xbf", true},
      {"\x80", false},              // a continuation byte in front
      {"\xc1\xbf", false},          // overlong: two bytes,
      {"\xe0\x9f\xbf", false},      // three,
      {"\xf0\x8f\xbf\xbf", false},  // four
      {"\xed\xa0\x80", false},      // surrogates
      {"\xf4\x90\x80\x80", false},  // behind the last code point
      {"\xf5\x80\x80\x80", false},  //
      {"\xc3", false},              // cut off
      {"\xe2\x82", false},          //
      {"\xf0\x9f\x94", false},      //
      {"\xc3(", false},             // not continued
      {"\xe2\x82z", false},         //
      {"\xf0\x9f\x94\xc0", false},  //
  };
  for (const auto& [text, valid] : rows)
    EXPECT_EQ(is_valid_utf8(bytes_of(text)), valid) << testing::PrintToString(text);
}

TEST_F(Text, Base64) {
  const std::string line(64, 'A');
  const std::pair<std::string, std::string> rows[] = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"\xfb\xef\xbe\xff\xff\xff", "++++////"},
      {std::string(47, '\0'), std::string(63, 'A') + "="},
      {std::string(48, '\0'), line},
      {std::string(97, '\0'), line + "\n" + line + "\nAA=="},
  };
  for (const auto& [data, expected] : rows) {
    heap_buffer text;
    ASSERT_TRUE(base64_encode(bytes_of(data), &text));
    EXPECT_EQ(text_of(text.view()), expected);
    platform::allocations_to_fail = 1;
    EXPECT_FALSE(base64_encode(bytes_of(data), &text));
    EXPECT_FALSE(text);
  }
}

}  // namespace
}  // namespace keymaster
