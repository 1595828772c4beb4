// The size of a new key: a generated one's is asked for; an imported one's is told by its data and
// may be repeated in its description.
#pragma once

#include "ta/params/param_set.h"

namespace keymaster {

// required_key_bits: *key_bits receives the description's unique KM_TAG_KEY_SIZE;
// KM_ERROR_INVALID_ARGUMENT when it is absent or repeated.
[[nodiscard]] keymaster_error_t required_key_bits(const keymaster_key_param_set_t& description,
                                                  uint32_t* key_bits);

// settle_key_bits: with `guessed_bits` told by the data, refuses a description whose unique
// KM_TAG_KEY_SIZE differs (KM_ERROR_IMPORT_PARAMETER_MISMATCH) and appends the tag when there is no
// unique one (a repeated tag counts as absent). *key_bits receives the size.
[[nodiscard]] keymaster_error_t settle_key_bits(keymaster_key_param_set_t* description,
                                                uint64_t guessed_bits, uint32_t* key_bits);

}  // namespace keymaster
