// Trace lines: "ERR [0x2a] KEYMASTER:begin:120: Too short input". Every failure and every command
// leaves one. A line is at most 256 bytes with its newline; levels above the platform's threshold
// are dropped before they are formatted.
#pragma once

#include "tee_extensions.h"

#include <cstdint>

namespace keymaster {

// trace_site: the function and line that a message is reported under. Taken as a default argument,
// here() names the caller, so that shared helpers trace in their callers' names.
struct trace_site {
  const char* function;
  int line;
  static constexpr trace_site here(const char* function = __builtin_FUNCTION(),
                                   int line = __builtin_LINE()) {
    return {function, line};
  }
};

// trace: one line at `level` (TEE_TRACE_ERROR, ...). A newline is appended when the message has
// none.
void trace(uint32_t level, trace_site at, const char* format, ...)
    __attribute__((format(printf, 3, 4)));

// trace_error: the same at error level. Cold: the compiler keeps what leads to it away from the
// path that succeeds.
void trace_error(trace_site at, const char* format, ...)
    __attribute__((format(printf, 2, 3), cold));

#define TRACE_ERROR(...) ::keymaster::trace_error(::keymaster::trace_site::here(), __VA_ARGS__)
#define TRACE_INFO(...) \
  ::keymaster::trace(TEE_TRACE_INFO, ::keymaster::trace_site::here(), __VA_ARGS__)
#define TRACE_DEBUG(...) \
  ::keymaster::trace(TEE_TRACE_DEBUG, ::keymaster::trace_site::here(), __VA_ARGS__)

}  // namespace keymaster
