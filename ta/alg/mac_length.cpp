// The shortest MAC that a key may be used with.
#include "ta/alg/mac_length.h"

namespace keymaster {

keymaster_error_t check_min_mac_bits(uint32_t min_mac_bits, uint32_t lowest, uint32_t highest) {
  if (min_mac_bits >= lowest && min_mac_bits <= highest && min_mac_bits % 8 == 0) {
    return KM_ERROR_OK;
  }
  return refuse(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, "Invalid KM_TAG_MIN_MAC_LENGTH %d",
                static_cast<int>(min_mac_bits));
}

}  // namespace keymaster
