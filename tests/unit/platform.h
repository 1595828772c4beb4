// A stand-in for the platform, just enough for code that needs no TEE: a counting heap and a trace
// output that keeps the lines. So these tests run wherever the code compiles.
#pragma once

#include "tee_extensions.h"

#include <cstddef>
#include <string>
#include <vector>

namespace platform {

extern size_t live_blocks;        // of TEE_Malloc
extern size_t unwiped_blocks;     // freed with something other than zeros in them
extern int allocations_to_fail;   // the how-manieth allocation from now fails, once; 0: none
extern size_t largest_request;    // in bytes
extern uint32_t trace_threshold;  // TEE_TRACE_
extern uint32_t trace_thread;
extern std::vector<std::string> trace_lines;

// reset: an empty heap's counts, no failure, no lines, debug level, thread 0x2a.
void reset();

// traced: whether the last line ends with the message "TEXT\n".
bool traced(const std::string& text);

}  // namespace platform
