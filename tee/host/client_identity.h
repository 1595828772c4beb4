// Who a client of the normal world is, found out by the TEE and not taken from the client's words.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

namespace tee {

// identify_client: the identity for a TEEC_LOGIN_ method. Public has the nil UUID; the others have
// a name-based one (RFC 4122, version 5) of the user id, the group id or the executable's path, or
// of two of them. The group methods take the group, a uint32_t that the process must be a member
// of, from `data`; the others want null. TEE_ERROR_BAD_PARAMETERS, or TEE_ERROR_ACCESS_DENIED for a
// group that the process is not in. May throw std::bad_alloc or std::runtime_error.
[[nodiscard]] TEE_Result identify_client(uint32_t method, const void* data, TEE_Identity* identity);

}  // namespace tee
