// Text as bytes, and well-formed UTF-8 (RFC 3629).
#pragma once

#include <string_view>

#include "ta/base/bytes.h"

namespace keymaster {

// text_bytes: the characters as they lie in memory.
inline byte_view text_bytes(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// is_valid_utf8: whether `text` is well-formed UTF-8 from end to end: no stray or missing
// continuation bytes, no overlong forms, no surrogates, nothing from 0x110000 on.
[[nodiscard]] bool is_valid_utf8(byte_view text);

}  // namespace keymaster
