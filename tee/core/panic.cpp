// Ends a trusted application that broke a rule of the API.
#include "tee/core/panic.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

namespace tee {

void panic(const char* call, const char* format, ...) {
  char message[256];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(message, sizeof(message), format, arguments);
  va_end(arguments);
  std::fprintf(stderr, "panic: %s: %s\n", call, message);
  std::abort();
}

}  // namespace tee
