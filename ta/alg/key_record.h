// The key material of asymmetric keys: u32 key size in bits, then the key's numbers in the order of
// its platform attributes, each a u32 length and the unsigned big-endian bytes as the platform
// gives and takes them.
#pragma once

#include "ta/base/tee_handles.h"
#include "ta/params/param_set.h"

namespace keymaster {

// generate_key_record: generates a key of `object_type` with the platform's `parameter` and builds
// its record from the attributes `ids`, none of which is longer than `longest` bytes. A platform
// that cannot make the key: its code, together with KM_ERROR_UNKNOWN_ERROR. -41,
// TEE_ERROR_OUT_OF_MEMORY: out of memory. -1000: the platform tells two lengths of one number.
// Messages go out under `at`.
[[nodiscard]] TEE_Result generate_key_record(uint32_t object_type, uint32_t key_bits,
                                             const TEE_Attribute& parameter,
                                             std::span<const uint32_t> ids, size_t longest,
                                             heap_buffer* record, keymaster_error_t* km_error);

// read_numbers: reads numbers.size() numbers into views of the source; false when it is too short.
[[nodiscard]] bool read_numbers(input_cursor* in, std::span<byte_view> numbers);

// read_attributes: reads a record's size field and its numbers, as reference attributes `ids` that
// point into `key_material`; `attributes` has room for them. False when the record is too short.
[[nodiscard]] bool read_attributes(byte_view key_material, std::span<const uint32_t> ids,
                                   uint32_t* key_bits, std::span<TEE_Attribute> attributes);

// load_key: an object of the platform for operations with the key.
[[nodiscard]] TEE_Result load_key(uint32_t object_type, uint32_t key_bits,
                                  std::span<const TEE_Attribute> attributes, tee_object* key);

}  // namespace keymaster
