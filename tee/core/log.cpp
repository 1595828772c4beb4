// What the host TEE itself has to say.
#include "tee/core/log.h"

#include <algorithm>
#include <cstdarg>
#include <cstdio>

#include "tee/core/trace.h"

namespace tee {

void log_line(uint32_t level, const char* format, ...) {
  if (level > trace_threshold()) return;
  char line[512] = "[TEE] ";
  constexpr size_t PREFIX = 6;
  constexpr size_t ROOM = sizeof(line) - PREFIX - 1;
  va_list arguments;
  va_start(arguments, format);
  int wanted = std::vsnprintf(line + PREFIX, ROOM, format, arguments);
  va_end(arguments);
  if (wanted < 0) return;
  size_t end = PREFIX + std::min(static_cast<size_t>(wanted), ROOM - 1);
  line[end] = '\n';
  write_trace(level, line, end + 1);
}

}  // namespace tee
