// Parameter sets and their marshalled form, against bytes that were written by hand.
#include "ta/params/param_set.h"

#include <algorithm>
#include <vector>

#include "fixture.h"
#include "ta/params/marshal.h"

namespace keymaster {
namespace {

using bytes = std::vector<uint8_t>;

bytes from_hex(std::string_view text) {
  bytes result;
  std::string digits;
  for (const char c : text) {
    if (c == ' ') continue;
    digits += c;
    if (digits.size() < 2) continue;
    result.push_back(static_cast<uint8_t>(std::stoi(digits, nullptr, 16)));
    digits.clear();
  }
  return result;
}

// Three entries: application id "hello", the algorithm, an empty nonce. Gaps and the value fields
// of blobs hold what no reader may interpret.
constexpr char THREE[] =
    "03000000"
    "59020090 a1a1a1a1 b1b2b3b4b5b6b7b8 05000000 c1c1c1c1 68656c6c6f"
    "02000010 a2a2a2a2 80000000b5b6b7b8 d1d1d1d1 c2c2c2c2"
    "e9030090 a3a3a3a3 b1b2b3b4b5b6b7b8 00000000 c3c3c3c3";
// The same as the TA writes it: blob values are zeros, all else is copied.
constexpr char THREE_WRITTEN[] =
    "03000000"
    "59020090 a1a1a1a1 0000000000000000 05000000 c1c1c1c1 68656c6c6f"
    "02000010 a2a2a2a2 80000000b5b6b7b8 d1d1d1d1 c2c2c2c2"
    "e9030090 a3a3a3a3 0000000000000000 00000000 c3c3c3c3";
// Without the application's tags.
constexpr char TWO_WRITTEN[] =
    "02000000"
    "02000010 a2a2a2a2 80000000b5b6b7b8 d1d1d1d1 c2c2c2c2"
    "e9030090 a3a3a3a3 0000000000000000 00000000 c3c3c3c3";

using ParamSet = platform::fixture;

bytes marshalled(const keymaster_key_param_set_t& set, bool include_all) {
  uint8_t* buffer = nullptr;
  uint32_t size = 0;
  EXPECT_EQ(marshal(set, include_all, &buffer, &size), TEE_SUCCESS);
  EXPECT_EQ(size, marshal_size(set, include_all));
  bytes result(buffer, buffer + size);
  heap_give_back(buffer, size);
  return result;
}

TEST_F(ParamSet, FreeingKeepsTheLength) {
  keymaster_key_param_set_t set;
  ASSERT_TRUE(add_integer(&set, KM_TAG_KEY_SIZE, 8));
  free_param_set(&set);
  EXPECT_EQ(set.params, nullptr);
  EXPECT_EQ(set.length, 1u);
  EXPECT_EQ(count_tag(set, KM_TAG_KEY_SIZE), 0u);  // what is gone is not walked
  ASSERT_TRUE(add_integer(&set, KM_TAG_KEY_SIZE, 8));
  EXPECT_EQ(set.length, 1u);
  free_param_set(nullptr);
}

TEST_F(ParamSet, MarshalsWhatItUnmarshalled) {
  bytes input = from_hex(THREE);
  input.push_back(0x99);  // bytes at the end are not looked at
  keymaster_key_param_set_t set;
  ASSERT_EQ(unmarshal(input, &set), TEE_SUCCESS);
  ASSERT_EQ(set.length, 3u);
  EXPECT_NE(set.params[2].data, nullptr);  // an empty blob is there
  EXPECT_EQ(marshalled(set, true), from_hex(THREE_WRITTEN));
  EXPECT_EQ(marshalled(set, false), from_hex(TWO_WRITTEN));

  keymaster_key_param_set_t empty;
  ASSERT_EQ(unmarshal(from_hex("00000000"), &empty), TEE_SUCCESS);
  EXPECT_EQ(marshalled(empty, true), from_hex("00000000"));
}

TEST_F(ParamSet, RefusesEveryPrefix) {
  const bytes whole = from_hex(THREE);
  for (size_t size = 0; size < whole.size(); size++) {
    keymaster_key_param_set_t set;
    EXPECT_EQ(unmarshal(byte_view(whole).first(size), &set), TEE_ERROR_GENERIC) << size;
    EXPECT_TRUE(set.params == nullptr && set.length == 0) << size;
    EXPECT_TRUE(platform::traced("Too short input")) << size;
    EXPECT_EQ(platform::live_blocks, 0u) << size;
  }
}

TEST_F(ParamSet, NeverTrustsACount) {
  const std::tuple<std::string_view, TEE_Result, const char*> cases[] = {
      {"ffffffff", TEE_ERROR_OUT_OF_MEMORY, "Out of memory"},
      {"abaaaa0a", TEE_ERROR_OUT_OF_MEMORY, "Out of memory"},  // x 24 is 2^32 + 8
      {"aaaaaa0a", TEE_ERROR_GENERIC, "Too short input"},      // x 24 is 2^32 - 16
      {"01000000 59020090 00000000 0000000000000000 ffffffff 00000000 00", TEE_ERROR_GENERIC,
       "Too short input"},
  };
  for (const auto& [input, res, message] : cases) {
    keymaster_key_param_set_t set;
    EXPECT_EQ(unmarshal(from_hex(input), &set), res) << input;
    EXPECT_LE(platform::largest_request, input.size());
    EXPECT_TRUE(platform::traced(message)) << message;
  }
  EXPECT_EQ(unmarshal(from_hex(THREE), nullptr), TEE_ERROR_SHORT_BUFFER);
}

TEST_F(ParamSet, MarshalFailsEmptyHanded) {
  keymaster_key_param_set_t set;
  ASSERT_EQ(unmarshal(from_hex(THREE), &set), TEE_SUCCESS);
  const auto whole = static_cast<uint32_t>(from_hex(THREE).size());
  uint8_t room[128] = {};
  for (uint32_t capacity = 0; capacity <= whole; capacity++) {
    std::ranges::fill(room, uint8_t{0xEE});
    uint8_t* buffer = room;
    uint32_t size = capacity;
    const bool fits = capacity == whole;
    EXPECT_EQ(marshal(set, true, &buffer, &size), fits ? TEE_SUCCESS : TEE_ERROR_SHORT_BUFFER);
    EXPECT_EQ(buffer, fits ? room : nullptr) << capacity;
    EXPECT_EQ(size, fits ? whole : 0) << capacity;
    EXPECT_EQ(room[capacity], 0xEE) << capacity;
    if (fits) break;
    EXPECT_TRUE(platform::traced("Too short marshalling buffer"));
  }

  keymaster_key_param_t hollow{};
  hollow.tag = KM_TAG_NONCE;
  ASSERT_TRUE(add_param(&set, hollow));
  uint8_t* buffer = nullptr;
  uint32_t size = 7;
  EXPECT_EQ(marshal(set, true, &buffer, &size), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_TRUE(platform::traced("Invalid keymaster_key_param_set_t"));
  EXPECT_TRUE(buffer == nullptr && size == 0);
}

}  // namespace
}  // namespace keymaster
