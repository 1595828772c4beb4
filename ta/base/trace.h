// Trace lines: "ERR [0x2a] KEYMASTER:begin:120: Too short input". Every failure and every command
// leaves one. A line is at most 256 bytes with its newline; levels above the platform's threshold
// are dropped before they are formatted.
#pragma once

#include "tee_extensions.h"

#include <cstdint>
#include <utility>

namespace keymaster {

// trace_scope: the name that messages go out under, from here to the end of the scope: that of the
// function that opens it, or one given. Functions that open none trace in the name of who called
// them, so shared helpers need not be told. The TA has one thread; the name is instance state.
class trace_scope {
 public:
  explicit trace_scope(const char* function = __builtin_FUNCTION())
      : outer_(std::exchange(current_name, function)) {}
  trace_scope(const trace_scope&) = delete;
  trace_scope& operator=(const trace_scope&) = delete;
  ~trace_scope() { current_name = outer_; }

  static const char* current() { return current_name; }
  // The state of a fresh instance, whatever an earlier one in this process left.
  static void reset() { current_name = ""; }

 private:
  static const char* current_name;
  const char* outer_;
};

// with_line: a code and the line of the statement that names it, which is what a trace line shows.
template <class T>
struct with_line {
  T code;
  int line;
  // NOLINTNEXTLINE(google-explicit-constructor): callers write the bare code.
  constexpr with_line(T value, int at = __builtin_LINE()) : code(value), line(at) {}
};

// trace: one line at `level` (TEE_TRACE_ERROR, ...). A newline is appended when the message has
// none.
void trace(with_line<uint32_t> level, const char* format, ...)
    __attribute__((format(printf, 2, 3)));

}  // namespace keymaster
