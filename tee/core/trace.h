// Trace output of trusted applications and of the host TEE: which lines go out, and where to.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tee {

// trace_threshold: the highest level (TEE_TRACE_) that is let through, 0 (none) to 4. At first it
// is $TEE_TRACE_LEVEL, or 1.
uint32_t trace_threshold();
void set_trace_level(uint32_t level);

// write_trace: sends a line, which has its newline and `length` bytes, where lines go, unless its
// level is filtered out.
void write_trace(uint32_t level, const char* line, size_t length);

// set_trace_sink: where lines go from now on; null: standard error. Call it while no trusted
// application runs.
using trace_sink = void (*)(void* context, uint32_t level, const char* line, size_t length);
void set_trace_sink(trace_sink write, void* context);

}  // namespace tee
