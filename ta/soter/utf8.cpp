// Well-formed UTF-8.
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

constexpr uint32_t SURROGATES = 0xD800;
constexpr uint32_t BEHIND_SURROGATES = 0xE000;
constexpr uint32_t BEHIND_LAST = 0x110000;

// How many bytes a sequence has, by its first byte; 0 when none begins with it.
size_t sequence_length(uint8_t first) {
  if (first < 0x80) return 1;
  if (first < 0xC2) return 0;  // a continuation byte, or one that makes only overlong forms
  if (first < 0xE0) return 2;
  if (first < 0xF0) return 3;
  return first <= 0xF4 ? 4 : 0;
}

bool is_valid_code_point(uint32_t code_point, size_t length) {
  constexpr uint32_t SMALLEST[] = {0, 0, 0x80, 0x800, 0x10000};  // by the sequence's length
  if (code_point < SMALLEST[length] || code_point >= BEHIND_LAST) return false;
  return code_point < SURROGATES || code_point >= BEHIND_SURROGATES;
}

bool is_valid_sequence(byte_view sequence) {
  const size_t length = sequence.size();
  if (length == 1) return true;
  uint32_t code_point = sequence[0] & (0xFFU >> (length + 1));
  for (const uint8_t byte : sequence.subspan(1)) {
    if ((byte & 0xC0) != 0x80) return false;
    code_point = code_point << 6 | (byte & 0x3FU);
  }
  return is_valid_code_point(code_point, length);
}

}  // namespace

bool is_valid_utf8(byte_view text) {
  while (!text.empty()) {
    const size_t length = sequence_length(text.front());
    if (length == 0 || length > text.size() || !is_valid_sequence(text.first(length))) return false;
    text = text.subspan(length);
  }
  return true;
}

}  // namespace keymaster
