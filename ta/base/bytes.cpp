// Borrowed bytes, cursors, and the comparison and wiping of secrets.
#include "ta/base/bytes.h"

#include <cstring>

namespace keymaster {

void copy_bytes(byte_span to, byte_view from) {
  if (!from.empty()) memmove(to.data(), from.data(), from.size());
}

void wipe(byte_span bytes) {
  if (bytes.empty()) return;
  memset(bytes.data(), 0, bytes.size());
  // Claims to read the memory, so that the stores above are not dead.
  __asm__ volatile("" : : "r"(bytes.data()) : "memory");
}

bool equal_constant_time(byte_view a, byte_view b) {
  if (a.size() != b.size()) return false;
  volatile uint8_t difference = 0;
  for (size_t i = 0; i < a.size(); i++) {
    difference = static_cast<uint8_t>(difference | (a[i] ^ b[i]));
  }
  return difference == 0;
}

bool input_cursor::read_into(byte_span to) {
  if (rest_.size() < to.size()) return false;
  copy_bytes(to, rest_.first(to.size()));
  rest_ = rest_.subspan(to.size());
  return true;
}

bool input_cursor::read_u16(uint16_t* value) {
  uint8_t bytes[2];
  if (!read_into(bytes)) return false;
  *value = static_cast<uint16_t>(bytes[0] | bytes[1] << 8);
  return true;
}

bool input_cursor::read_u32(uint32_t* value) {
  uint8_t bytes[4];
  if (!read_into(bytes)) return false;
  *value = static_cast<uint32_t>(bytes[0]) | static_cast<uint32_t>(bytes[1]) << 8 |
           static_cast<uint32_t>(bytes[2]) << 16 | static_cast<uint32_t>(bytes[3]) << 24;
  return true;
}

bool input_cursor::read_u64(uint64_t* value) {
  uint32_t low = 0;
  uint32_t high = 0;
  if (left() < sizeof(*value) || !read_u32(&low) || !read_u32(&high)) return false;
  *value = low | uint64_t{high} << 32;
  return true;
}

bool input_cursor::read_bytes(size_t length, byte_view* bytes) {
  if (rest_.size() < length) return false;
  *bytes = rest_.first(length);
  rest_ = rest_.subspan(length);
  return true;
}

bool input_cursor::read_field(byte_view* bytes) {
  const byte_view before = rest_;
  uint32_t length = 0;
  if (read_u32(&length) && read_bytes(length, bytes)) return true;
  rest_ = before;
  return false;
}

bool output_cursor::reserve(size_t length, byte_span* room) {
  if (rest_.size() < length) return false;
  *room = rest_.first(length);
  rest_ = rest_.subspan(length);
  return true;
}

bool output_cursor::write_bytes(byte_view bytes) {
  byte_span room;
  if (!reserve(bytes.size(), &room)) return false;
  copy_bytes(room, bytes);
  return true;
}

bool output_cursor::write_u16(uint16_t value) {
  const uint8_t bytes[] = {static_cast<uint8_t>(value), static_cast<uint8_t>(value >> 8)};
  return write_bytes(bytes);
}

bool output_cursor::write_u32(uint32_t value) {
  byte_span room;
  if (!reserve(sizeof(value), &room)) return false;
  store_u32(room, value);
  return true;
}

bool output_cursor::write_field(byte_view bytes) {
  if (bytes.size() > UINT32_MAX || rest_.size() < sizeof(uint32_t) ||
      rest_.size() - sizeof(uint32_t) < bytes.size()) {
    return false;
  }
  return write_u32(static_cast<uint32_t>(bytes.size())) && write_bytes(bytes);
}

void store_u32(byte_span to, uint32_t value) {
  for (size_t i = 0; i < sizeof(value); i++)
    to[i] = static_cast<uint8_t>(value >> (8 * i));
}

}  // namespace keymaster
