// The shortest MAC that a key may be used with.
#pragma once

#include "ta/params/param_set.h"

namespace keymaster {

// check_min_mac_bits: whether a KM_TAG_MIN_MAC_LENGTH lies in lowest..highest (bits) and is whole
// bytes; else KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH.
[[nodiscard]] keymaster_error_t check_min_mac_bits(uint32_t min_mac_bits, uint32_t lowest,
                                                   uint32_t highest);

}  // namespace keymaster
