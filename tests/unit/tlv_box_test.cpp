// TLV boxes: their bytes, what closes them, and what is made of bytes that others wrote.
#include "ta/soter/tlv_box.h"

#include <gtest/gtest.h>
#include <vector>

namespace keymaster {
namespace {

using std::vector;

vector<uint8_t> bytes_of(byte_view view) {
  return {view.begin(), view.end()};
}

TEST(TlvBox, IsWrittenFromTheLastItemToTheFirst) {
  const heap_ptr<tlv_box> inner = tlv_box_create();
  ASSERT_EQ(tlv_box_put_string(inner.get(), 0x0102, "hi"), 0);
  const heap_ptr<tlv_box> box = tlv_box_create();
  EXPECT_EQ(tlv_box_put_object(box.get(), 3, *inner), -1) << "still open";
  ASSERT_EQ(tlv_box_serialize(inner.get()), 0);
  EXPECT_EQ(tlv_box_put(box.get(), 1, uint32_t{0x11223344}), 0);
  EXPECT_EQ(tlv_box_put_bytes(box.get(), 2, {}), 0);
  EXPECT_EQ(tlv_box_put_object(box.get(), 3, *inner), 0);
  EXPECT_EQ(tlv_box_put(box.get(), 1, uint8_t{5}), -1) << "its tag is there";
  const vector<uint8_t> too_long(65536);
  EXPECT_EQ(tlv_box_put_bytes(box.get(), 4, too_long), -1);
  EXPECT_EQ(tlv_box_get_size(*box), 23u);
  EXPECT_EQ(tlv_box_get_buffer(*box).size(), 0u) << "open";
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  EXPECT_EQ(bytes_of(tlv_box_get_buffer(*box)),
            (vector<uint8_t>{3, 0, 7, 0, 2,    1,    3,    0,   'h', 'i', 0,  //
                             2, 0, 0, 0,                                      //
                             1, 0, 4, 0, 0x44, 0x33, 0x22, 0x11}));
  EXPECT_EQ(tlv_box_put(box.get(), 9, uint8_t{5}), -1);
  EXPECT_EQ(tlv_box_serialize(box.get()), -1);
}

TEST(TlvBox, GivesBackWhatWasPut) {
  const heap_ptr<tlv_box> box = tlv_box_create();
  ASSERT_EQ(tlv_box_put(box.get(), 2, int16_t{-300}), 0);
  ASSERT_EQ(tlv_box_put(box.get(), 8, -1e300), 0);
  ASSERT_EQ(tlv_box_serialize(box.get()), 0);
  const heap_ptr<tlv_box> read = tlv_box_parse(tlv_box_get_buffer(*box));
  int16_t two = 0;
  double eight = 0;
  EXPECT_EQ(tlv_box_get(*read, 2, &two), 0);
  EXPECT_EQ(tlv_box_get(*read, 8, &eight), 0);
  EXPECT_TRUE(two == -300 && eight == -1e300);
  EXPECT_EQ(tlv_box_get(*read, 2, &eight), -1) << "the item is shorter";
  EXPECT_EQ(tlv_box_get(*read, 3, &two), -1);
  vector<uint8_t> room(5, 0xEE);
  size_t length = 0;
  EXPECT_EQ(tlv_box_get_bytes(*read, 8, room, &length), -1);
  EXPECT_EQ(tlv_box_get_bytes(*read, 2, room, &length), 0);
  EXPECT_EQ(length, 2u);
  EXPECT_EQ(room, (vector<uint8_t>{0xD4, 0xFE, 0, 0, 0}));
}

TEST(TlvBox, ParsesToTheEndAndNoFurther) {
  const vector<uint8_t> whole = {1, 0, 1, 0, 'a', 1, 0, 1, 0, 'b', 2, 0, 4, 0, 3, 0, 0, 0};
  for (size_t size = 0; size <= whole.size(); size++) {
    // In a block of its own, so that a sanitizer sees every step beyond it.
    const vector<uint8_t> cut(whole.begin(), whole.begin() + static_cast<ptrdiff_t>(size));
    const heap_ptr<tlv_box> box = tlv_box_parse(cut);
    ASSERT_TRUE(box);
    EXPECT_EQ(bytes_of(tlv_box_get_buffer(*box)), cut);
    EXPECT_EQ(tlv_box_get_size(*box), size);
    byte_view value;
    ASSERT_EQ(tlv_box_get_bytes_ptr(*box, 1, &value), size < 5 ? -1 : 0) << size;
    EXPECT_TRUE(size < 5 || (value.size() == 1 && value[0] == 'a')) << "the first of two counts";
    heap_ptr<tlv_box> inner;
    ASSERT_EQ(tlv_box_get_object(*box, 2, &inner), size < whole.size() ? -1 : 0) << size;
    EXPECT_TRUE(!inner || tlv_box_get_bytes_ptr(*inner, 3, &value) == 0);
    EXPECT_EQ(tlv_box_put(box.get(), 9, uint8_t{1}), -1) << "closed";
  }
}

TEST(KeyList, RemovesAndReplacesAnyItem) {
  key_list list;
  for (uint8_t key = 1; key <= 5; key++) {
    heap_buffer value;
    EXPECT_TRUE(value.copy_of({&key, 1}) && list.add(key, std::move(value)));
  }
  for (const uint16_t key : {uint16_t{5}, uint16_t{3}, uint16_t{1}})  // at both ends, and between
    EXPECT_TRUE(list.remove(key));
  EXPECT_FALSE(list.remove(3));
  heap_buffer other;
  EXPECT_TRUE(other.allocate(1) && list.replace(2, std::move(other)));
  vector<int> left;
  for (const key_list::item* item = list.head(); item != nullptr; item = item->next) {
    EXPECT_TRUE(item->next == nullptr || item->next->previous == item);
    left.push_back(*list.get(item->key)->view().data());
  }
  EXPECT_EQ(left, (vector{4, 0}));
}

}  // namespace
}  // namespace keymaster
