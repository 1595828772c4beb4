// The messages between a client and the process that serves a device.
#include "tee/wire/records.h"

#include <algorithm>

namespace tee::wire {

namespace {

constexpr size_t WORD = 4;

}  // namespace

void writer::u32(uint32_t value) {
  std::array<uint8_t, WORD> word{};
  for (uint8_t& byte : word) {
    byte = static_cast<uint8_t>(value);
    value >>= 8;
  }
  bytes(word);
}

void writer::bytes(std::span<const uint8_t> value) {
  ok_ = ok_ && value.size() <= to_.size() - at_;
  if (!ok_) return;
  std::copy(value.begin(), value.end(), to_.begin() + static_cast<ptrdiff_t>(at_));
  at_ += value.size();
}

void writer::pad() {
  static constexpr std::array<uint8_t, ALIGNMENT> ZEROS{};
  bytes(std::span(ZEROS).first(padded(at_) - at_));
}

uint32_t reader::u32() {
  uint32_t value = 0;
  const std::span<const uint8_t> word = bytes(WORD);
  for (size_t i = word.size(); i > 0; i--)
    value = value << 8 | word[i - 1];
  return value;
}

std::span<const uint8_t> reader::bytes(size_t size) {
  ok_ = ok_ && size <= from_.size() - at_;
  if (!ok_) return {};
  at_ += size;
  return from_.subspan(at_ - size, size);
}

void reader::pad() {
  bytes(padded(at_) - at_);
}

void write(writer& to, const call& value) {
  to.u32(value.types);
  for (const slot& one : value.slots) {
    to.u32(one.a);
    to.u32(one.b);
    to.u32(one.c);
    to.u32(one.d);
  }
  to.pad();
}

call read_call(reader& from) {
  call value;
  value.types = from.u32();
  for (slot& one : value.slots) {
    one.a = from.u32();
    one.b = from.u32();
    one.c = from.u32();
    one.d = from.u32();
  }
  from.pad();
  return value;
}

void write(writer& to, const answer& value) {
  to.u32(value.result);
  to.u32(value.origin);
  to.u32(value.number);
  to.u32(value.second);
  for (const slot& one : value.slots) {
    to.u32(one.a);
    to.u32(one.b);
  }
}

answer read_answer(reader& from) {
  answer value;
  value.result = from.u32();
  value.origin = from.u32();
  value.number = from.u32();
  value.second = from.u32();
  for (slot& one : value.slots) {
    one.a = from.u32();
    one.b = from.u32();
  }
  return value;
}

}  // namespace tee::wire
