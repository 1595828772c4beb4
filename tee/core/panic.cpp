// Ends a trusted application that broke a rule of the API.
#include "tee/core/panic.h"

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "tee/core/log.h"

namespace tee {

namespace {

std::atomic<bool> process_ends = false;

}  // namespace

void end_process_on_panic(bool wanted) {
  process_ends = wanted;
}

void panic(const char* call, const char* format, ...) {
  char message[256];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(message, sizeof(message), format, arguments);
  va_end(arguments);
  if (at_border.innermost == nullptr || process_ends) {
    std::fprintf(stderr, "panic: %s: %s\n", call, message);
    std::abort();
  }
  const bool guarded = !at_border.in_trusted;
  at_border.in_trusted = false;  // until here, a handler may leave
  log_line(TEE_TRACE_ERROR, "panic: %s: %s", call, message);
  if (!guarded) leave_trusted(LEFT_BY_PANIC);
  throw panic_in_host{};
}

}  // namespace tee
