// The platform's extensions as this port gives them (extensions.cpp, ports/adapter).
#pragma once

#include <tee_internal_api.h>  // by the search path, on which the kit follows

// OP-TEE's identifiers of trusted storage. Replay-protected storage is a partition of an eMMC; a
// device without one keeps the key storage key in the secure storage for all, which OP-TEE seals
// under the device's key. One or the other for ever: each has keys that the other does not know.
#ifdef KEYMASTER_NO_RPMB
#define TEE_STORAGE_RPMB 0x00000001
#else
#define TEE_STORAGE_RPMB 0x80000100
#endif

#include "tee/include/tee_extensions.h"
