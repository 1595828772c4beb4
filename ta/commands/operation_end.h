// How an operation ends: one way for a failed begin, a failed update, finish and abort.
#pragma once

#include <cstdint>

#include "ta/alg/algorithm.h"

namespace keymaster {

// free_ended: frees the object's characteristics, then the object.
void free_ended(operation_t* operation);

// end_operation: takes the handle out of the pool and frees the object.
void end_operation(operation_t* operation, uint32_t handle);

}  // namespace keymaster
