// The byte form of parameter sets, in which they cross the TA's boundary and lie in key blobs:
//   u32 count; then for each entry its 24-byte record and, for blob tags, data_length bytes.
// Integers are little-endian; nothing is padded. docs/formats.md has the offsets.
#pragma once

#include "ta/params/param_set.h"

namespace keymaster {

// unmarshal: builds a new set from `input` into `*set`; what the set held before is not looked at.
// Bytes after the last entry are ignored. The value field of a blob's entry is not interpreted.
// Each byte of `input` is read once. On failure the set is empty. TEE_ERROR_SHORT_BUFFER: `set` is
// null. TEE_ERROR_GENERIC: the input ends too early. TEE_ERROR_OUT_OF_MEMORY: no memory, or a count
// whose array would pass 32 bits.
[[nodiscard]] TEE_Result unmarshal(byte_view input, keymaster_key_param_set_t* set);

// marshal_size: bytes that marshal writes. Without `include_all` the application's identifier and
// data and the root of trust are left out: the form that goes back to the client.
[[nodiscard]] uint32_t marshal_size(const keymaster_key_param_set_t& set, bool include_all);

// marshal: writes the set. With *buffer null it allocates exactly the marshalled size, which the
// caller frees with heap_give_back; otherwise *size is the capacity of *buffer. *size receives the
// bytes written. On failure *buffer is null and *size 0, also when the buffer was the caller's.
// TEE_ERROR_SHORT_BUFFER: capacity too small. TEE_ERROR_OUT_OF_MEMORY. TEE_ERROR_BAD_PARAMETERS: a
// blob entry without data.
[[nodiscard]] TEE_Result marshal(const keymaster_key_param_set_t& set, bool include_all,
                                 uint8_t** buffer, uint32_t* size);

}  // namespace keymaster
