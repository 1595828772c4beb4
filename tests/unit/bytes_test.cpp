// Cursors: nothing outside their range is touched, and a call that fails moves nothing.
#include "base/bytes.h"

#include <array>
#include <gtest/gtest.h>

namespace keymaster {
namespace {

TEST(InputCursor, ReadsLittleEndianFieldsUpToTheLastByte) {
  const uint8_t input[] = {0x78, 0x56, 0x34, 0x12, 3, 0, 0, 0, 'a', 'b', 'c', 0, 0, 0, 0};
  input_cursor in(input);
  uint32_t number = 0;
  byte_view field;
  ASSERT_TRUE(in.read_u32(&number));
  EXPECT_EQ(number, 0x12345678u);
  ASSERT_TRUE(in.read_field(&field));
  EXPECT_EQ(field.data(), input + 8);
  EXPECT_EQ(field.size(), 3u);
  ASSERT_TRUE(in.read_field(&field));
  EXPECT_TRUE(field.empty());
  EXPECT_EQ(in.left(), 0u);
  EXPECT_FALSE(in.read_u32(&number));
}

TEST(InputCursor, FailsWithoutMoving) {
  // A length one too large, and lengths that would wrap an address or a 32-bit sum.
  for (const uint32_t length : {5u, 0x7FFFFFFFu, 0xFFFFFFFCu, 0xFFFFFFFFu}) {
    std::array<uint8_t, 8> input{};
    store_u32(input, length);
    input_cursor in(input);
    byte_view field;
    EXPECT_FALSE(in.read_field(&field)) << length;
    EXPECT_EQ(in.left(), 8u) << length;
    EXPECT_FALSE(in.read_bytes(length == 5 ? 9 : length, &field)) << length;
    EXPECT_EQ(in.rest().data(), input.data()) << length;
  }
}

TEST(OutputCursor, WritesExactlyWhatFits) {
  const uint8_t abc[] = {'a', 'b', 'c'};
  for (size_t size = 0; size <= 8; size++) {
    std::array<uint8_t, 8> room;
    room.fill(0xEE);
    output_cursor out(byte_span(room).first(size));
    EXPECT_EQ(out.write_field(abc), size >= 7) << size;
    EXPECT_EQ(out.written(), size >= 7 ? 7u : 0u) << size;
    EXPECT_EQ(room[0], size >= 7 ? 3 : 0xEE) << size;
    EXPECT_EQ(room[6], size >= 7 ? 'c' : 0xEE) << size;
    EXPECT_EQ(room[7], 0xEE) << size;
  }
}

TEST(Bytes, ComparesWholeRanges) {
  const uint8_t a[] = {1, 2, 3};
  const uint8_t b[] = {1, 2, 4};
  EXPECT_TRUE(equal_constant_time(a, a));
  EXPECT_FALSE(equal_constant_time(a, b));
  EXPECT_FALSE(equal_constant_time(a, byte_view(a).first(2)));
  EXPECT_TRUE(equal_constant_time({}, {}));
}

}  // namespace
}  // namespace keymaster
