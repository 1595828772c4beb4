// What the API functions on operations share: finding the operation and checking that the call fits
// its kind and state. A call that does not fit is an error of the trusted application: it panics.
#pragma once

#include "tee_internal_api.h"

#include "tee/core/operation.h"

namespace tee {

// operation_of: the operation behind a handle; panics unless its algorithm is of that family.
operation& operation_of(const char* call, TEE_OperationHandle handle, crypto::family kind);

// keyed_operation_of: likewise, and the operation must have its key.
operation& keyed_operation_of(const char* call, TEE_OperationHandle handle, crypto::family kind);

// running_operation_of: likewise, between its init and its final.
operation& running_operation_of(const char* call, TEE_OperationHandle handle, crypto::family kind);

// offers: whether the platform has keys of that type and size.
bool offers(const crypto::key_type& type, uint32_t bits);

// require_mode: panics unless the operation was allocated for that mode.
void require_mode(const char* call, const operation& op, uint32_t mode);

}  // namespace tee
