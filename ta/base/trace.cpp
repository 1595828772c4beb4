// Formatting of trace lines, and the makers of failures.
#include "ta/base/trace.h"

#include <algorithm>
#include <cstdarg>
#include <cstddef>
#include <cstdio>

#include "ta/base/outcome.h"

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

size_t write_prefix(char* line, size_t room, with_line<uint32_t> level) {
  const char* name = level_name(level.code);
  const char* function = trace_scope::current();
  const uint32_t thread = TEE_TraceThread();
  const int result =
      thread == 0 ? snprintf(line, room, "%s %s:%s:%d: ", name, TRACE_NAME, function, level.line)
                  : snprintf(line, room, "%s [0x%x] %s:%s:%d: ", name, thread, TRACE_NAME, function,
                             level.line);
  return written(result, room);
}

// The last byte is kept for the newline; the terminating zero that snprintf puts there is dropped.
__attribute__((format(printf, 2, 0))) void write_line(with_line<uint32_t> level, const char* format,
                                                      va_list arguments) {
  if (level.code > TEE_TraceThreshold()) return;
  char line[MAX_LINE_SIZE];
  size_t length = write_prefix(line, sizeof(line), level);
  const size_t room = sizeof(line) - length;
  length += written(vsnprintf(line + length, room, format, arguments), room);
  if (length == 0 || line[length - 1] != '\n') line[length++] = '\n';
  TEE_TraceWrite(level.code, line, length);
}

}  // namespace

const char* trace_scope::current_name = "";

void trace(with_line<uint32_t> level, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  write_line(level, format, arguments);
  va_end(arguments);
}

TEE_Result fail(with_line<TEE_Result> code, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  write_line({TEE_TRACE_ERROR, code.line}, format, arguments);
  va_end(arguments);
  return code.code;
}

TEE_Result checked(with_line<TEE_Result> res, const char* call) {
  return res.code == TEE_SUCCESS ? TEE_SUCCESS
                                 : fail(res, "%s failed with 0x%08x\n", call, res.code);
}

keymaster_error_t refuse(with_line<keymaster_error_t> code, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  write_line({TEE_TRACE_ERROR, code.line}, format, arguments);
  va_end(arguments);
  return code.code;
}

}  // namespace keymaster
