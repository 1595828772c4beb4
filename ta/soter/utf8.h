// Well-formed UTF-8 (RFC 3629).
#pragma once

#include "ta/base/bytes.h"

namespace keymaster {

// is_valid_utf8: whether `text` is well-formed UTF-8 from end to end: no stray or missing
// continuation bytes, no overlong forms, no surrogates, nothing from 0x110000 on.
[[nodiscard]] bool is_valid_utf8(byte_view text);

}  // namespace keymaster
