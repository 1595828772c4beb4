// The DER writer's primitives.
#include "ta/der/der.h"

namespace keymaster {
namespace {

constexpr uint32_t TAG_NUMBER_MASK = DER_CONSTRUCTED - 1;
constexpr uint32_t TAG_WORD_MASK = 0x3FFFFFFF;
constexpr uint8_t HIGH_TAG_NUMBER = 0x1F;
constexpr uint8_t MORE_FOLLOWS = 0x80;

int32_t write_byte(der_cursor* out, uint8_t value) {
  return der_write_bytes(out, {&value, 1});
}

// The sum of two results, the first failure among them passed on.
int32_t add(int32_t a, int32_t b) {
  if (a < 0) return a;
  if (b < 0) return b;
  return a > INT32_MAX - b ? DER_TOO_SMALL : a + b;
}

// Base 128, most significant first, with a mark on every octet but the last.
int32_t write_base128(der_cursor* out, uint64_t value) {
  int32_t total = write_byte(out, static_cast<uint8_t>(value & 0x7F));
  while (total >= 0 && (value >>= 7) != 0) {
    total = add(total, write_byte(out, static_cast<uint8_t>((value & 0x7F) | MORE_FOLLOWS)));
  }
  return total;
}

}  // namespace

keymaster_error_t der_error(int32_t result) {
  if (result >= 0) return KM_ERROR_OK;
  const bool no_room = result == DER_TOO_SMALL || result == DER_NO_MEMORY;
  return no_room ? KM_ERROR_MEMORY_ALLOCATION_FAILED : KM_ERROR_UNKNOWN_ERROR;
}

bool der_cursor::reserve(size_t size, byte_span* room) {
  if (position_ < size) return false;
  position_ -= size;
  *room = buffer_.subspan(position_, size);
  return true;
}

int32_t der_write_bytes(der_cursor* out, byte_view bytes) {
  byte_span room;
  if (bytes.size() > static_cast<size_t>(INT32_MAX) || !out->reserve(bytes.size(), &room)) {
    return DER_TOO_SMALL;
  }
  copy_bytes(room, bytes);
  return static_cast<int32_t>(bytes.size());
}

int32_t der_write_length(der_cursor* out, size_t length) {
  uint8_t octets[5] = {};
  uint8_t count = 0;
  if (length < 128) return write_byte(out, static_cast<uint8_t>(length));
  for (size_t rest = length; rest != 0 && count < 4; rest >>= 8)
    count++;
  octets[0] = static_cast<uint8_t>(0x80 | count);
  for (uint8_t i = 0; i < count; i++) {
    octets[count - i] = static_cast<uint8_t>(length >> (8 * i));
  }
  return der_write_bytes(out, byte_view(octets).first(count + size_t{1}));
}

int32_t der_write_tag(der_cursor* out, uint32_t tag) {
  if ((tag & ~TAG_WORD_MASK) != 0) return DER_INVALID;
  const uint32_t number = tag & TAG_NUMBER_MASK;
  const uint32_t leading = (tag >> 22) & 0xE0;  // class and constructed flag
  if (number < HIGH_TAG_NUMBER) return write_byte(out, static_cast<uint8_t>(leading | number));
  const int32_t octets = write_base128(out, number);
  return add(octets, write_byte(out, static_cast<uint8_t>(leading | HIGH_TAG_NUMBER)));
}

int32_t der_wrap(der_cursor* out, uint32_t tag, int32_t content) {
  if (content < 0) return content;
  const int32_t with_length = add(content, der_write_length(out, static_cast<size_t>(content)));
  return with_length < 0 ? with_length : add(with_length, der_write_tag(out, tag));
}

int32_t der_write_boolean(der_cursor* out, bool value) {
  return der_wrap(out, DER_BOOLEAN, write_byte(out, value ? 0xFF : 0x00));
}

int32_t der_write_null(der_cursor* out) {
  return der_wrap(out, DER_NULL, 0);
}

int32_t der_write_integer(der_cursor* out, byte_view big_endian) {
  while (!big_endian.empty() && big_endian[0] == 0)
    big_endian = big_endian.subspan(1);
  int32_t content = der_write_bytes(out, big_endian);
  if (big_endian.empty() || (big_endian[0] & 0x80) != 0) {
    content = content < 0 ? content : add(content, write_byte(out, 0));
  }
  return der_wrap(out, DER_INTEGER, content);
}

int32_t der_write_integer(der_cursor* out, uint64_t value) {
  uint8_t bytes[sizeof(value)];
  for (size_t i = 0; i < sizeof(bytes); i++) {
    bytes[i] = static_cast<uint8_t>(value >> (8 * (sizeof(bytes) - 1 - i)));
  }
  return der_write_integer(out, byte_view(bytes));
}

int32_t der_write_octet_string(der_cursor* out, byte_view bytes) {
  return der_wrap(out, DER_OCTET_STRING, der_write_bytes(out, bytes));
}

int32_t der_write_utf8_string(der_cursor* out, byte_view bytes) {
  return der_wrap(out, DER_UTF8_STRING, der_write_bytes(out, bytes));
}

int32_t der_write_bit_string(der_cursor* out, byte_view bytes, uint64_t bits) {
  const uint8_t unused = static_cast<uint8_t>(bytes.size() * 8 - bits);
  const int32_t octets = der_write_bytes(out, bytes);
  return der_wrap(out, DER_BIT_STRING, octets < 0 ? octets : add(octets, write_byte(out, unused)));
}

int32_t der_write_oid(der_cursor* out, std::span<const uint64_t> arcs) {
  if (arcs.empty()) return DER_INVALID;
  int32_t content = 0;
  for (size_t i = arcs.size(); i > 2 && content >= 0; i--) {
    content = add(content, write_base128(out, arcs[i - 1]));
  }
  if (content < 0) return content;
  const uint64_t first = arcs.size() == 1 ? arcs[0] : 40 * arcs[0] + arcs[1];
  return der_wrap(out, DER_OBJECT_IDENTIFIER, add(content, write_base128(out, first)));
}

}  // namespace keymaster
