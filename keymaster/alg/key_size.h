// The size of an imported key, which its data tells and its description may repeat.
#pragma once

#include "keymaster/params/param_set.h"

namespace keymaster {

// settle_key_bits: with `guessed_bits` told by the data, refuses a description whose unique
// KM_TAG_KEY_SIZE differs (KM_ERROR_IMPORT_PARAMETER_MISMATCH) and appends the tag when there is no
// unique one (a repeated tag counts as absent). *key_bits receives the size. Messages go out under
// `at`.
[[nodiscard]] keymaster_error_t settle_key_bits(keymaster_key_param_set_t* description,
                                                uint64_t guessed_bits, uint32_t* key_bits,
                                                trace_site at = trace_site::here());

}  // namespace keymaster
