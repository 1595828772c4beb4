// TLV box: the container in which the vault hands out keys and properties. Serialised, it is a
// sequence of items without header, count or padding; an item is
//   0 u16 tag, 2 u16 length L of the value, 4 L bytes of value
// in little-endian order. A value may itself be a serialised box.
#pragma once

#include <type_traits>

#include "ta/base/heap.h"
#include "ta/soter/key_list.h"

namespace keymaster {

// A box is open to puts until it is serialised; one made by parsing is closed from the start. A tag
// occurs once. Items are serialised in the reverse of the order in which they were put.
struct tlv_box {
  key_list items;
  heap_buffer serialized;  // none while the box is open
  size_t length = 0;       // of the serialised form, in bytes

  bool is_closed() const { return static_cast<bool>(serialized); }
};

// tlv_box_create: an empty box, or none when out of memory.
[[nodiscard]] heap_ptr<tlv_box> tlv_box_create();

// tlv_box_parse: a closed box with a copy of `buffer` and one item per item in it. Of a tag that
// repeats the first occurrence stays; an item that the buffer's end cuts is dropped with what
// follows. None when out of memory.
[[nodiscard]] heap_ptr<tlv_box> tlv_box_parse(byte_view buffer);

// tlv_box_serialize: closes the box. -1 when it is closed already or memory runs out.
[[nodiscard]] int tlv_box_serialize(tlv_box* box);

// tlv_box_get_buffer: the serialised form; empty while the box is open. tlv_box_get_size: its
// length in bytes, which is known before, too.
byte_view tlv_box_get_buffer(const tlv_box& box);
size_t tlv_box_get_size(const tlv_box& box);

// tlv_box_putobject: adds an item. -1, with the box as it was, when the box is closed, the tag is
// there, the value is longer than 65535 bytes or memory runs out. Every other put is through it.
[[nodiscard]] int tlv_box_putobject(tlv_box* box, uint16_t tag, byte_view value);

// Values of 1, 2, 4 or 8 bytes, in the processor's byte order, which is little-endian wherever this
// runs.
template <class T>
concept tlv_number = std::is_arithmetic_v<T> && sizeof(T) <= 8;

// tlv_box_put: a number of a fixed width. tlv_box_put_string: the characters and the terminating
// zero. tlv_box_put_bytes: as they are. tlv_box_put_object: a closed box (-1 for an open one).
template <tlv_number T>
[[nodiscard]] int tlv_box_put(tlv_box* box, uint16_t tag, T value) {
  return tlv_box_putobject(box, tag, object_bytes(std::as_const(value)));
}
[[nodiscard]] int tlv_box_put_string(tlv_box* box, uint16_t tag, const char* text);
[[nodiscard]] int tlv_box_put_bytes(tlv_box* box, uint16_t tag, byte_view bytes);
[[nodiscard]] int tlv_box_put_object(tlv_box* box, uint16_t tag, const tlv_box& object);

// tlv_box_get_bytes_ptr: the value under `tag`, within the box. -1: no such tag.
[[nodiscard]] int tlv_box_get_bytes_ptr(const tlv_box& box, uint16_t tag, byte_view* bytes);

// tlv_box_get_bytes: copies the value into `buffer`, the rest of which becomes zero, and sets
// *length to the value's. -1, with nothing changed: no such tag, or a buffer that is too small.
[[nodiscard]] int tlv_box_get_bytes(const tlv_box& box, uint16_t tag, byte_span buffer,
                                    size_t* length);

// tlv_box_get: a number from the first bytes of the value. -1, with *value as it was: no such tag,
// or a shorter value.
template <tlv_number T>
[[nodiscard]] int tlv_box_get(const tlv_box& box, uint16_t tag, T* value) {
  byte_view bytes;
  if (tlv_box_get_bytes_ptr(box, tag, &bytes) != 0 || bytes.size() < sizeof(T)) return -1;
  copy_bytes(object_bytes(*value), bytes.first(sizeof(T)));
  return 0;
}

// tlv_box_get_object: the value, parsed as a box. -1: no such tag, or out of memory.
[[nodiscard]] int tlv_box_get_object(const tlv_box& box, uint16_t tag, heap_ptr<tlv_box>* object);

}  // namespace keymaster
