// Cursors: nothing outside their range is touched, and a call that fails moves nothing.
#include "base/bytes.h"

#include <array>
#include <gtest/gtest.h>

namespace keymaster {
namespace {

TEST(InputCursor, FailsWithoutMoving) {
  // What fits, a length one too large, and lengths that would wrap an address or a 32-bit sum.
  for (const uint32_t length : {4u, 5u, 0x7FFFFFFFu, 0xFFFFFFFCu, 0xFFFFFFFFu}) {
    std::array<uint8_t, 8> input{};
    store_u32(input, length);
    input_cursor in(input);
    byte_view field;
    EXPECT_EQ(in.read_field(&field), length == 4) << length;
    EXPECT_EQ(in.left(), length == 4 ? 0u : 8u) << length;
    EXPECT_EQ(field.size(), length == 4 ? 4u : 0u) << length;
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

}  // namespace
}  // namespace keymaster
