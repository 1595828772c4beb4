// Any bytes as a TLV box. What is parsed are the items that a walk apart from the code finds whole,
// the first of each tag; put into a box anew they serialise to bytes that parse to the same items.
// The heap is empty afterwards.
#include <algorithm>
#include <cstdlib>
#include <memory>
#include <utility>
#include <vector>

#include "platform.h"
#include "ta/soter/tlv_box.h"

using namespace keymaster;

namespace {

using bytes = std::vector<uint8_t>;
using item = std::pair<uint16_t, bytes>;

void require(bool holds) {
  if (!holds) std::abort();
}

// The items of `input` in order, without those that repeat a tag.
std::vector<item> walk(const bytes& input) {
  std::vector<item> items;
  const auto u16 = [&](size_t at) { return static_cast<uint16_t>(input[at] | input[at + 1] << 8); };
  for (size_t at = 0; input.size() - at >= 4;) {
    const uint16_t tag = u16(at);
    const size_t length = u16(at + 2);
    at += 4;
    if (input.size() - at < length) break;
    const auto value = input.begin() + static_cast<std::ptrdiff_t>(at);
    at += length;
    if (std::ranges::any_of(items, [&](const item& known) { return known.first == tag; })) continue;
    items.emplace_back(tag, bytes(value, value + static_cast<std::ptrdiff_t>(length)));
  }
  return items;
}

// From a block of exactly its size, so that a sanitizer sees one byte too far.
heap_ptr<tlv_box> parsed(byte_view input) {
  const auto block = std::make_unique<uint8_t[]>(input.size());
  std::ranges::copy(input, block.get());
  heap_ptr<tlv_box> box = tlv_box_parse({block.get(), input.size()});
  require(bool(box) && std::ranges::equal(tlv_box_get_buffer(*box), input));
  require(tlv_box_putobject(box.get(), 1, {}) != 0 && tlv_box_serialize(box.get()) != 0);
  return box;
}

void require_items(const tlv_box& box, const std::vector<item>& items) {
  size_t count = 0;
  for (const key_list::item* held = box.items.head(); held != nullptr; held = held->next)
    count++;
  require(count == items.size());
  for (const auto& [tag, value] : items) {
    bytes room(value.size());
    size_t length = 0;
    require(tlv_box_get_bytes(box, tag, room, &length) == 0);
    require(length == value.size() && room == value);
    uint64_t number = 0;
    require((tlv_box_get(box, tag, &number) == 0) == (value.size() >= sizeof(number)));
    heap_ptr<tlv_box> object;
    require(tlv_box_get_object(box, tag, &object) == 0);
    require_items(*object, walk(value));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  platform::reset();
  {
    const bytes input(data, data + size);
    std::vector<item> items = walk(input);
    require_items(*parsed(input), items);

    const heap_ptr<tlv_box> made = tlv_box_create();
    for (const auto& [tag, value] : items)
      require(tlv_box_put_bytes(made.get(), tag, value) == 0);
    require(tlv_box_serialize(made.get()) == 0);
    const byte_view text = tlv_box_get_buffer(*made);
    require(text.size() == tlv_box_get_size(*made));
    require_items(*parsed(text), items);
    std::ranges::reverse(items);
    require(walk(bytes(text.begin(), text.end())) == items);
  }
  require(platform::live_blocks == 0 && platform::unwiped_blocks == 0);
  return 0;
}
