// Formatting of trace lines.
#include "ta/base/trace.h"

#include <algorithm>
#include <cstdarg>
#include <cstddef>
#include <cstdio>

namespace keymaster {
namespace {

constexpr char TRACE_NAME[] = "KEYMASTER";
constexpr size_t MAX_LINE_SIZE = 256;

const char* level_name(uint32_t level) {
  switch (level) {
    case TEE_TRACE_ERROR:
      return "ERR";
    case TEE_TRACE_INFO:
      return "INF";
    case TEE_TRACE_DEBUG:
      return "DBG";
    case TEE_TRACE_FLOW:
      return "FLW";
    default:
      return "UKN";
  }
}

// What snprintf says it would have written, as what it did write into `room` bytes.
size_t written(int result, size_t room) {
  if (result < 0 || room == 0) return 0;
  return std::min(static_cast<size_t>(result), room - 1);
}

size_t write_prefix(char* line, size_t room, uint32_t level, trace_site at) {
  const uint32_t thread = TEE_TraceThread();
  if (thread == 0) {
    return written(
        snprintf(line, room, "%s %s:%s:%d: ", level_name(level), TRACE_NAME, at.function, at.line),
        room);
  }
  return written(snprintf(line, room, "%s [0x%x] %s:%s:%d: ", level_name(level), thread, TRACE_NAME,
                          at.function, at.line),
                 room);
}

// The last byte is kept for the newline; the terminating zero that snprintf puts there is dropped.
__attribute__((format(printf, 3, 0))) void write_line(uint32_t level, trace_site at,
                                                      const char* format, va_list arguments) {
  char line[MAX_LINE_SIZE];
  size_t length = write_prefix(line, sizeof(line), level, at);
  const size_t room = sizeof(line) - length;
  length += written(vsnprintf(line + length, room, format, arguments), room);
  if (length == 0 || line[length - 1] != '\n') line[length++] = '\n';
  TEE_TraceWrite(level, line, length);
}

}  // namespace

void trace(uint32_t level, trace_site at, const char* format, ...) {
  if (level > TEE_TraceThreshold()) return;
  va_list arguments;
  va_start(arguments, format);
  write_line(level, at, format, arguments);
  va_end(arguments);
}

void trace_error(trace_site at, const char* format, ...) {
  if (TEE_TRACE_ERROR > TEE_TraceThreshold()) return;
  va_list arguments;
  va_start(arguments, format);
  write_line(TEE_TRACE_ERROR, at, format, arguments);
  va_end(arguments);
}

}  // namespace keymaster
