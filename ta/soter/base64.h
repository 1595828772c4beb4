// Base64 text (RFC 4648, section 4) in the lines of PEM (RFC 7468).
#pragma once

#include "ta/base/heap.h"

namespace keymaster {

// base64_encode: puts the text of `data` into *text: lines of 64 characters, the last one up to as
// many, joined by "\n", without one at the end and without a zero byte. No data makes no
// characters. False when out of memory; *text is then empty.
[[nodiscard]] bool base64_encode(byte_view data, heap_buffer* text);

}  // namespace keymaster
