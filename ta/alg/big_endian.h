// Unsigned big-endian numbers as byte strings.
#pragma once

#include <cstdint>

#include "ta/base/bytes.h"

namespace keymaster {

// without_leading_zeros: the number's significant bytes; none for 0.
byte_view without_leading_zeros(byte_view number);

// right_align: moves the first `length` bytes of `buffer` to its end and zeroes what is in front.
void right_align(byte_span buffer, size_t length);

// store_u64_big_endian: writes `value` into the first eight bytes.
void store_u64_big_endian(byte_span to, uint64_t value);

// load_u64_big_endian: the number in at most eight bytes.
uint64_t load_u64_big_endian(byte_view number);

}  // namespace keymaster
