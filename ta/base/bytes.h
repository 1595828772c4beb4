// Borrowed bytes and the two cursors through which every parse and every write goes.
#pragma once

#include "tee_internal_api.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>

namespace keymaster {

using byte_view = std::span<const uint8_t>;
using byte_span = std::span<uint8_t>;

// tee_size: the width that this platform gives to lengths, so that one source serves TEEs whose
// lengths are uint32_t and those whose lengths are size_t. Everything whose address goes to a TEE
// call as a length is declared with it.
using tee_size = decltype(TEE_Param{}.memref.size);
static_assert(sizeof(tee_size) == sizeof(TEE_Attribute{}.content.ref.length));

// copy_bytes: copies `from`, which may overlap, to the start of `to`, which holds at least
// from.size() bytes. Legal for empty ranges with null pointers, which memmove is not.
void copy_bytes(byte_span to, byte_view from);

// wipe: overwrites the bytes with zeros in a way that the compiler keeps.
void wipe(byte_span bytes);

// secret_bytes: a secret of N bytes on the stack, wiped when its scope ends.
template <size_t N>
struct secret_bytes : std::array<uint8_t, N> {
  secret_bytes() : std::array<uint8_t, N>{} {}
  secret_bytes(const secret_bytes&) = delete;
  secret_bytes& operator=(const secret_bytes&) = delete;
  ~secret_bytes() { wipe(*this); }
};

// equal_constant_time: whether both ranges have the same length and bytes. The time taken depends
// on the lengths alone. The one comparison for whatever an attacker may guess at.
[[nodiscard]] bool equal_constant_time(byte_view a, byte_view b);

// object_bytes: the bytes of a plain record.
template <class T>
byte_span object_bytes(T& object) {
  static_assert(std::is_trivially_copyable_v<T>);
  return {reinterpret_cast<uint8_t*>(&object), sizeof(T)};
}
template <class T>
byte_view object_bytes(const T& object) {
  static_assert(std::is_trivially_copyable_v<T>);
  return {reinterpret_cast<const uint8_t*>(&object), sizeof(T)};
}

// input_cursor: reads a sequence of little-endian fields. A read that does not fit says false and
// moves nothing. Each byte is read once, so the source may be memory that others write to; views
// that read_bytes and read_field hand out still point into the source.
class input_cursor {
 public:
  explicit input_cursor(byte_view input) : rest_(input) {}

  [[nodiscard]] bool read_u16(uint16_t* value);
  [[nodiscard]] bool read_u32(uint32_t* value);
  [[nodiscard]] bool read_u64(uint64_t* value);
  [[nodiscard]] bool read_bytes(size_t length, byte_view* bytes);
  [[nodiscard]] bool read_into(byte_span to);
  // A 32-bit length and that many bytes.
  [[nodiscard]] bool read_field(byte_view* bytes);

  byte_view rest() const { return rest_; }
  size_t left() const { return rest_.size(); }

 private:
  byte_view rest_;
};

// output_cursor: writes a sequence of little-endian fields into a bounded buffer, which it never
// reads. A write that does not fit says false and writes nothing.
class output_cursor {
 public:
  explicit output_cursor(byte_span output) : rest_(output), capacity_(output.size()) {}

  [[nodiscard]] bool write_u16(uint16_t value);
  [[nodiscard]] bool write_u32(uint32_t value);
  [[nodiscard]] bool write_bytes(byte_view bytes);
  // A 32-bit length and the bytes.
  [[nodiscard]] bool write_field(byte_view bytes);
  // Room for a platform call, or for a length that is known later; the cursor moves past it.
  [[nodiscard]] bool reserve(size_t length, byte_span* room);

  byte_span rest() const { return rest_; }
  size_t left() const { return rest_.size(); }
  size_t written() const { return capacity_ - rest_.size(); }

 private:
  byte_span rest_;
  size_t capacity_;
};

// store_u32: writes `value` into the first four bytes, little-endian.
void store_u32(byte_span to, uint32_t value);

}  // namespace keymaster
