// The kit's header of the same name, for C++: it declares its C functions without saying so, and
// defines some words that are ours.
#pragma once

extern "C" {
#include_next <tee_internal_api.h>
}

#undef TRACE_ERROR
#undef TRACE_INFO
#undef TRACE_DEBUG
#undef __data
