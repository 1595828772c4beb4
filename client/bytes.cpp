// Hexadecimal text and the fields of command buffers.
#include "keymaster/client/bytes.h"

#include <limits>
#include <utility>

namespace keymaster::client {

namespace {

uint8_t digit_value(char digit) {
  if (digit >= '0' && digit <= '9') return static_cast<uint8_t>(digit - '0');
  if (digit >= 'a' && digit <= 'f') return static_cast<uint8_t>(digit - 'a' + 10);
  if (digit >= 'A' && digit <= 'F') return static_cast<uint8_t>(digit - 'A' + 10);
  throw std::invalid_argument("not a hexadecimal digit");
}

template <typename T>
void append_number(bytes* buffer, T value) {
  for (size_t i = 0; i < sizeof(T); ++i) {
    buffer->push_back(static_cast<uint8_t>(value >> (8 * i)));
  }
}

template <typename T>
T assemble(byte_view data) {
  T value = 0;
  for (size_t i = sizeof(T); i-- > 0;) {
    value = static_cast<T>(value << 8 | data[i]);
  }
  return value;
}

}  // namespace

void append(bytes* to, byte_view data) {
  if (data.empty()) return;  // memcpy wants no null pointer
  size_t length = to->size();
  to->resize(length + data.size());
  memcpy(to->data() + length, data.data(), data.size());
}

bytes copy_of(byte_view data) {
  bytes copy;
  append(&copy, data);
  return copy;
}

std::string to_hex(byte_view data) {
  constexpr char DIGITS[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * data.size());
  for (uint8_t byte : data) {
    text += DIGITS[byte >> 4];
    text += DIGITS[byte & 15];
  }
  return text;
}

bytes from_hex(std::string_view text) {
  if (text.size() % 2 != 0) throw std::invalid_argument("an odd number of hexadecimal digits");
  bytes data;
  data.reserve(text.size() / 2);
  for (size_t i = 0; i < text.size(); i += 2) {
    data.push_back(static_cast<uint8_t>(digit_value(text[i]) << 4 | digit_value(text[i + 1])));
  }
  return data;
}

field_writer& field_writer::u32(uint32_t value) {
  append_number(&buffer_, value);
  return *this;
}

field_writer& field_writer::u64(uint64_t value) {
  append_number(&buffer_, value);
  return *this;
}

field_writer& field_writer::raw(byte_view data) {
  append(&buffer_, data);
  return *this;
}

field_writer& field_writer::field(byte_view data) {
  if (data.size() > std::numeric_limits<uint32_t>::max()) {
    throw std::length_error("a field holds less than 4 GiB");
  }
  return u32(static_cast<uint32_t>(data.size())).raw(data);
}

bytes field_writer::take() {
  return std::exchange(buffer_, {});
}

byte_view field_reader::raw(size_t length) {
  if (length > rest_.size()) {
    throw format_error("ends too early: " + std::to_string(length) + " bytes wanted, " +
                       std::to_string(rest_.size()) + " left");
  }
  byte_view taken = rest_.first(length);
  rest_ = rest_.subspan(length);
  return taken;
}

uint32_t field_reader::u32() {
  return assemble<uint32_t>(raw(sizeof(uint32_t)));
}

uint64_t field_reader::u64() {
  return assemble<uint64_t>(raw(sizeof(uint64_t)));
}

byte_view field_reader::field() {
  byte_view start = rest_;
  try {
    return raw(u32());
  } catch (const format_error&) {
    rest_ = start;
    throw;
  }
}

void field_reader::finish() const {
  if (!rest_.empty()) {
    throw format_error(std::to_string(rest_.size()) + " bytes too many at the end");
  }
}

}  // namespace keymaster::client
