// The counter of SOTER signatures, which lives in trusted storage and only grows.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

namespace keymaster {

// increase_and_get_counter: adds 1 to the device's counter, stores it, and puts it into *counter; a
// new device's first is 1. On failure *counter is 0 and the stored value is as it was, unless the
// write itself came through. TEE_ERROR_BAD_STATE: the stored object does not hold 8 bytes, which is
// never repaired, since any value could be one that was used. Otherwise the platform's code.
[[nodiscard]] TEE_Result increase_and_get_counter(uint64_t* counter);

}  // namespace keymaster
