// The DER writer (X.690): encodes backwards. Every write puts its bytes right before what is
// already written, so that a value's length is known before its tag and length go in front of it.
// There is no reader.
#pragma once

#include <cstdint>

#include "ta/base/bytes.h"
#include "ta/params/tags.h"

namespace keymaster {

// What a writer returns: the bytes it wrote, or one of these.
constexpr int32_t DER_TOO_SMALL = -108;  // the buffer is too small; a larger one may do
constexpr int32_t DER_NO_MEMORY = -106;
constexpr int32_t DER_INVALID = -104;

// der_error: what such a result comes to for a client: -41 when there was no room, -1000 for any
// other failure.
[[nodiscard]] keymaster_error_t der_error(int32_t result);

// A tag word: class in bits 28 and 29, constructed flag in bit 27, number in the bits below.
constexpr uint32_t DER_CONTEXT = 0x20000000;
constexpr uint32_t DER_CONSTRUCTED = 0x08000000;
constexpr uint32_t DER_BOOLEAN = 1;
constexpr uint32_t DER_INTEGER = 2;
constexpr uint32_t DER_BIT_STRING = 3;
constexpr uint32_t DER_OCTET_STRING = 4;
constexpr uint32_t DER_NULL = 5;
constexpr uint32_t DER_OBJECT_IDENTIFIER = 6;
constexpr uint32_t DER_UTF8_STRING = 12;
constexpr uint32_t DER_SEQUENCE = DER_CONSTRUCTED | 16;
constexpr uint32_t DER_SET = DER_CONSTRUCTED | 17;
constexpr uint32_t DER_UTC_TIME = 23;
constexpr uint32_t DER_GENERALIZED_TIME = 24;

// der_cursor: moves from the end of a buffer towards its start, which is the limit.
class der_cursor {
 public:
  explicit der_cursor(byte_span buffer) : buffer_(buffer), position_(buffer.size()) {}

  // Room for `size` bytes right before what is written; false, with nothing moved, when there is
  // less.
  [[nodiscard]] bool reserve(size_t size, byte_span* room);
  // What is written so far; its first byte is the last identifier octet that was put in front.
  byte_span written() const { return buffer_.subspan(position_); }

 private:
  byte_span buffer_;
  size_t position_;
};

// The parts of an encoding.
[[nodiscard]] int32_t der_write_bytes(der_cursor* out, byte_view bytes);
[[nodiscard]] int32_t der_write_length(der_cursor* out, size_t length);
// Numbers above 30 take the high-tag-number form. DER_INVALID: bits 30 or 31 are set.
[[nodiscard]] int32_t der_write_tag(der_cursor* out, uint32_t tag);
// Length and tag in front of `content` bytes that are written; a negative `content` is passed on.
// The result counts all three.
[[nodiscard]] int32_t der_wrap(der_cursor* out, uint32_t tag, int32_t content);

// Whole values.
[[nodiscard]] int32_t der_write_boolean(der_cursor* out, bool value);
[[nodiscard]] int32_t der_write_null(der_cursor* out);
// INTEGER from unsigned big-endian bytes: leading zeros dropped, one put back where the top bit is
// set. No bytes are the number 0.
[[nodiscard]] int32_t der_write_integer(der_cursor* out, byte_view big_endian);
[[nodiscard]] int32_t der_write_integer(der_cursor* out, uint64_t value);
[[nodiscard]] int32_t der_write_octet_string(der_cursor* out, byte_view bytes);
[[nodiscard]] int32_t der_write_utf8_string(der_cursor* out, byte_view bytes);
// BIT STRING of `bits` bits from ceil(bits / 8) bytes.
[[nodiscard]] int32_t der_write_bit_string(der_cursor* out, byte_view bytes, uint64_t bits);
// OBJECT IDENTIFIER from its arcs. DER_INVALID: none.
[[nodiscard]] int32_t der_write_oid(der_cursor* out, std::span<const uint64_t> arcs);

}  // namespace keymaster
