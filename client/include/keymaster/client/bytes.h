// Byte strings of the client, and the fields of which command buffers are made.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <stdexcept>
#include <string.h>
#include <string>
#include <string_view>
#include <vector>

namespace keymaster::client {

using byte_view = std::span<const uint8_t>;

template <typename T>
struct wiping_allocator {
  using value_type = T;
  wiping_allocator() = default;
  template <typename U>
  explicit wiping_allocator(const wiping_allocator<U>& /*other*/) {}
  T* allocate(size_t count) { return std::allocator<T>().allocate(count); }
  void deallocate(T* block, size_t count) {
    explicit_bzero(block, count * sizeof(T));
    std::allocator<T>().deallocate(block, count);
  }
  bool operator==(const wiping_allocator& /*other*/) const { return true; }
};

// Owned bytes. They may be key material, tokens or plaintext, so their memory is wiped before it is
// freed; one type for all of them leaves nothing to choose wrongly.
using bytes = std::vector<uint8_t, wiping_allocator<uint8_t>>;

// as_bytes: the characters of a text, without a terminating zero.
inline byte_view as_bytes(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// append: adds `data` to the end of `to`. Faster than the container's own insertion, which goes
// byte by byte with an allocator that is not the standard one.
void append(bytes* to, byte_view data);

// copy_of: the bytes of a view, owned.
bytes copy_of(byte_view data);

// to_hex: two lower-case digits a byte.
std::string to_hex(byte_view data);

// from_hex: the bytes of a text of hexadecimal digit pairs, either case. Throws
// std::invalid_argument for any other text.
bytes from_hex(std::string_view text);

// What a trusted application answered is not in the form that it should have.
class format_error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// field_writer: builds a buffer of little-endian fields.
class field_writer {
 public:
  // `expected` is how much will be written; more is legal and costs a copy.
  explicit field_writer(size_t expected = 0) { buffer_.reserve(expected); }

  field_writer& u32(uint32_t value);
  field_writer& u64(uint64_t value);
  field_writer& raw(byte_view data);

  // A 32-bit length, then the bytes. std::length_error for more than 2^32 - 1 of them.
  field_writer& field(byte_view data);

  // take: what was written; the writer is empty afterwards.
  bytes take();

 private:
  bytes buffer_;
};

// field_reader: reads a buffer of little-endian fields. Every read that does not fit throws
// format_error and moves nothing. Views point into the buffer.
class field_reader {
 public:
  explicit field_reader(byte_view buffer) : rest_(buffer) {}

  uint32_t u32();
  uint64_t u64();
  byte_view raw(size_t length);

  // A 32-bit length, then that many bytes.
  byte_view field();

  size_t left() const { return rest_.size(); }

  // finish: throws format_error unless everything was read.
  void finish() const;

 private:
  byte_view rest_;
};

}  // namespace keymaster::client
