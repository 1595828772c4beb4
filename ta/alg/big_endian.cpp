// Unsigned big-endian numbers as byte strings.
#include "ta/alg/big_endian.h"

#include <algorithm>

namespace keymaster {

byte_view without_leading_zeros(byte_view number) {
  size_t zeros = 0;
  while (zeros < number.size() && number[zeros] == 0)
    zeros++;
  return number.subspan(zeros);
}

void right_align(byte_span buffer, size_t length) {
  const byte_span front = buffer.first(buffer.size() - length);
  std::copy_backward(buffer.begin(), buffer.begin() + static_cast<ptrdiff_t>(length), buffer.end());
  std::fill(front.begin(), front.end(), uint8_t{0});
}

void store_u64_big_endian(byte_span to, uint64_t value) {
  for (size_t i = sizeof(value); i-- > 0; value >>= 8)
    to[i] = static_cast<uint8_t>(value);
}

uint64_t load_u64_big_endian(byte_view number) {
  uint64_t value = 0;
  for (const uint8_t byte : number)
    value = value << 8 | byte;
  return value;
}

}  // namespace keymaster
