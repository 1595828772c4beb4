// The operation pool: maps the handles that begin gives out to the operations that live between
// begin and the command that ends them. All sessions of the instance share its 16 slots.
#pragma once

#include <cstdint>

#include "ta/alg/algorithm.h"

namespace keymaster {

// operation_pool_init: empties the pool, whatever an earlier instance in this process left in it.
void operation_pool_init();

// operation_pool_add: enters `operation` in the lowest free slot under a new random handle, never 0
// and never one that a slot still remembers. KM_ERROR_TOO_MANY_OPERATIONS, with *handle 0, when all
// slots are taken. The pool does not own the operation.
[[nodiscard]] keymaster_error_t operation_pool_add(operation_t* operation, uint32_t* handle);

// operation_pool_remove: frees the handle's slot; the operation is the caller's to free. An unknown
// handle is traced, nothing else.
void operation_pool_remove(uint32_t handle);

// operation_pool_get: the operation under `handle`; null when there is none.
operation_t* operation_pool_get(uint32_t handle);

}  // namespace keymaster
