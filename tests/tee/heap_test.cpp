// The heap of a trusted application: its bound, what blocks hold, and what is left in them.
#include <algorithm>
#include <cstring>

#include "support.h"
#include "tee/controls/host_control.h"

namespace tee::test {
namespace {

using ta_heap = in_instance;
using ta_heap_death = in_instance;

bool all(const void* block, size_t size, uint8_t value) {
  const auto* bytes = static_cast<const uint8_t*>(block);
  return std::all_of(bytes, bytes + size, [=](uint8_t byte) { return byte == value; });
}

TEST_F(ta_heap, blocks_are_filled_as_the_hint_says) {
  // Freed memory is used again by the host's allocator: what was there must not show.
  for (int round = 0; round < 4; ++round) {
    void* zero = TEE_Malloc(100, TEE_MALLOC_FILL_ZERO);
    void* unfilled = TEE_Malloc(100, TEE_MALLOC_NO_FILL);
    EXPECT_TRUE(all(zero, 100, 0));
    EXPECT_TRUE(all(unfilled, 100, 0xA5));
    std::memset(zero, 0x11, 100);
    void* grown = TEE_Realloc(zero, 200);
    EXPECT_TRUE(all(grown, 100, 0x11));
    EXPECT_TRUE(all(static_cast<uint8_t*>(grown) + 100, 100, 0));
    void* shrunk = TEE_Realloc(grown, 10);
    EXPECT_TRUE(all(shrunk, 10, 0x11));
    TEE_Free(shrunk);
    TEE_Free(unfilled);
  }
  EXPECT_EQ(ta_.counts(), host::live_counts{});
}

TEST_F(ta_heap, the_bound_holds_and_hostile_sizes_get_null) {
  EXPECT_EQ(TEE_Malloc(SIZE_MAX, 0), nullptr);
  EXPECT_EQ(TEE_Malloc(HEAP_LIMIT + 1, 0), nullptr);
  void* most = TEE_Malloc(HEAP_LIMIT - 10, 0);
  ASSERT_NE(most, nullptr);
  EXPECT_EQ(TEE_Malloc(11, 0), nullptr);
  void* rest = TEE_Malloc(10, 0);
  ASSERT_NE(rest, nullptr);
  EXPECT_EQ(TEE_Realloc(rest, SIZE_MAX), nullptr);
  EXPECT_EQ(ta_.counts().heap_bytes, HEAP_LIMIT);
  // Two blocks of no bytes are two blocks, and cost something.
  EXPECT_EQ(TEE_Malloc(0, 0), nullptr);
  TEE_Free(most);
  most = TEE_Malloc(HEAP_LIMIT - 50, 0);
  void* none[2] = {TEE_Malloc(0, 0), TEE_Realloc(nullptr, 0)};
  EXPECT_NE(none[0], nullptr);
  EXPECT_NE(none[0], none[1]);
  EXPECT_EQ(TEE_Realloc(nullptr, 0), nullptr);
  EXPECT_EQ(ta_.counts().heap_blocks, 4U);
  for (void* block : {most, rest, none[0], none[1]})
    TEE_Free(block);
  TEE_Free(nullptr);
  EXPECT_EQ(ta_.counts(), host::live_counts{});
}

TEST_F(ta_heap, freed_blocks_are_wiped) {
  static bool shown_as_left;
  static bool wiped;
  shown_as_left = wiped = false;
  host::set_block_hook(
      [](void*, host::block_stage stage, const uint8_t* block, size_t size) {
        if (stage == host::block_stage::RELEASED) shown_as_left = all(block, size, 0x77);
        if (stage == host::block_stage::WIPED) wiped = all(block, size, 0);
      },
      nullptr);
  void* block = TEE_Malloc(333, 0);
  std::memset(block, 0x77, 333);
  TEE_Free(block);
  host::set_block_hook(nullptr, nullptr);
  EXPECT_TRUE(shown_as_left);
  EXPECT_TRUE(wiped);
}

TEST_F(ta_heap_death, addresses_that_are_no_block_panic) {
  uint8_t local = 0;
  auto* block = static_cast<uint8_t*>(TEE_Malloc(8, 0));
  EXPECT_DEATH(TEE_Free(block + 1), "panic: TEE_Free: .* is not a live block");
  EXPECT_DEATH(TEE_Realloc(&local, 5), "panic: TEE_Realloc: .* is not a live block");
  TEE_Free(block);
  EXPECT_DEATH(TEE_Free(block), "panic: TEE_Free: .* is not a live block");
}

}  // namespace
}  // namespace tee::test
