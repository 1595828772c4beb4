// The key material of asymmetric keys: u32 key size in bits, then the key's numbers in the order of
// its platform attributes, each a u32 length and the unsigned big-endian bytes as the platform
// gives and takes them.
#pragma once

#include "ta/base/tee_handles.h"
#include "ta/params/param_set.h"

namespace keymaster {

// key_form: what a record is made of.
struct key_form {
  uint32_t object_type;  // TEE_TYPE_*
  uint32_t key_bits;
  std::span<const uint32_t> ids;  // the attributes of the numbers, in order
  size_t longest;                 // no number has more bytes
};

// generate_key_record: generates a key with the platform's `parameter` and builds its record. A
// platform that cannot make the key: its code, together with KM_ERROR_UNKNOWN_ERROR. -41,
// TEE_ERROR_OUT_OF_MEMORY: out of memory. -1000: the platform tells two lengths of one number.
outcome generate_key_record(const key_form& form, const TEE_Attribute& parameter,
                            heap_buffer* record);

// read_numbers: reads numbers.size() numbers into views of the source; false when it is too short.
[[nodiscard]] bool read_numbers(input_cursor* in, std::span<byte_view> numbers);

// number_attributes: makes reference attributes `ids` of the numbers' significant bytes.
// TEE_ERROR_BAD_PARAMETERS, traced: a number is 0, or longer than `longest` bytes. A platform may
// end the TA that hands over such a number.
[[nodiscard]] TEE_Result number_attributes(std::span<const uint32_t> ids,
                                           std::span<const byte_view> numbers, size_t longest,
                                           std::span<TEE_Attribute> attributes);

// load_key: an object of the platform for operations with the key.
[[nodiscard]] TEE_Result load_key(uint32_t object_type, uint32_t key_bits,
                                  std::span<const TEE_Attribute> attributes, tee_object* key);

}  // namespace keymaster
