// DER of ECDSA signatures (RFC 3279, 2.2.3): a SEQUENCE of the INTEGERs r and s. Needs the heap and
// nothing else of the platform. The thresholds of the long length form are one below the byte
// boundaries, as they have always been; no length of a signature on the offered curves meets them.
#pragma once

#include "ta/base/heap.h"

namespace keymaster {

// encode_length: writes a DER length: one byte up to 126, else 0x80 | L and the L low bytes of the
// length, most significant first; L is 1 up to 254, 2 up to 65534, 3 up to 16777214, else 4. False
// when it does not fit.
[[nodiscard]] bool encode_length(output_cursor* out, uint32_t length);

// der_encode_ec_signature: encodes r and s, unsigned big-endian numbers, into *signature. Zero is
// written with length 0. TEE_ERROR_OUT_OF_MEMORY. TEE_ERROR_GENERIC: a part is exactly 127 bytes
// long, which the size calculation and the length encoding take differently: intended.
[[nodiscard]] TEE_Result der_encode_ec_signature(byte_view r, byte_view s, heap_buffer* signature);

// der_decode_ec_signature: decodes `der`, which must be what der_encode_ec_signature makes, into r
// and s, right-aligned behind zeros. It is read more than once, so it may not lie in memory that
// others write to. TEE_ERROR_GENERIC for everything else, TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result der_decode_ec_signature(byte_view der, byte_span r, byte_span s);

}  // namespace keymaster
