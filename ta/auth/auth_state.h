// The authorisation state of the instance as a whole: token key and cache, use log, clock.
#pragma once

#include "tee_internal_api.h"

namespace keymaster {

// authorizaiton_init: makes the state anew, whatever an earlier instance in this process left. On
// failure nothing stays allocated; the platform's code or TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result authorizaiton_init();

// authorization_destroy: frees the state.
void authorization_destroy();

}  // namespace keymaster
