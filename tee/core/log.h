// What the host TEE itself has to say, through the same output as the trusted applications' traces.
#pragma once

#include "tee_extensions.h"

#include <cstdint>

namespace tee {

// log_line: writes the text and a newline at `level` (TEE_TRACE_) unless the level is filtered out.
// Never holds the content of a buffer that a trusted application or a client owns.
__attribute__((format(printf, 2, 3))) void log_line(uint32_t level, const char* format, ...);

}  // namespace tee
