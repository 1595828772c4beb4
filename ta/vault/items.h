// Items of the TLV boxes that the vault keeps, as the factory writes them and SOTER reads them.
#pragma once

#include <cstdint>

namespace keymaster {

// The key box holds an RSA key: big-endian unsigned integers, n, e and d alone or all eight.
enum key_box_item : uint16_t { KEY_N = 17, KEY_E, KEY_D, KEY_P, KEY_Q, KEY_DP, KEY_DQ, KEY_QINV };

// The property box: name and version of the fingerprint sensor, UUID of the fingerprint TA.
enum property_box_item : uint16_t { FP_NAME = 6197, FP_VERSION, FP_UUID };

}  // namespace keymaster
