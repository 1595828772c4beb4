// The way from the entry point to a command's handler.
#pragma once

#include "tee_internal_api.h"

namespace keymaster {

// dispatch: finds the command, checks its parameter types and value slot, runs its handler and
// writes the outcome back: the Keymaster error to slot 0 `a`, the command's own value to `b`, the
// produced size to slot 2. TEE_ERROR_BAD_PARAMETERS: unknown command, wrong types, value fields
// that must be zero and are not; else the handler's code.
TEE_Result dispatch(uint32_t command, uint32_t types, TEE_Param* params);

}  // namespace keymaster
