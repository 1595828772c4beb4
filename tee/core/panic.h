// The one place where a trusted application is ended for a programming error, and the wrapper that
// keeps host exceptions from leaving a C entry point.
#pragma once

#include "tee_internal_api.h"

#include <exception>
#include <new>
#include <type_traits>

#include "tee/core/border.h"

namespace tee {

// panic: reports CALL and the message, and ends the trusted application that made `call`: its
// instance alone when it was entered over a border, else the process (abort). The message names the
// argument and the rule that was broken, never the content of a buffer. Inside guarded() the host's
// frames are unwound; outside of it nothing that needs unwinding may be open.
[[noreturn]] __attribute__((format(printf, 2, 3), cold)) void panic(const char* call,
                                                                    const char* format, ...);

// end_process_on_panic: has every panic end the process, as fuzzers and debuggers want it.
void end_process_on_panic(bool wanted);

// What a panic unwinds the host's frames with.
struct panic_in_host {};

// guarded: runs the body of the API function `call`. Lack of host memory becomes
// TEE_ERROR_OUT_OF_MEMORY where the body returns a result; whatever else the body throws, and lack
// of memory in a call that cannot report it, is a panic, and so is a stack with no room left.
template <typename Body>
// NOLINTNEXTLINE(bugprone-exception-escape): what is no std::exception may end the process
auto guarded(const char* call, Body&& body) noexcept -> decltype(body()) {
  if (!host_scope::has_stack()) [[unlikely]]
    panic(call, "the stack is exhausted");
  try {
    host_scope stay;
    try {
      return body();
    } catch (const std::bad_alloc&) {
      if constexpr (std::is_same_v<decltype(body()), TEE_Result>) return TEE_ERROR_OUT_OF_MEMORY;
      panic(call, "out of host memory");
    } catch (const std::exception& error) {
      panic(call, "%s", error.what());
    }
  } catch (const panic_in_host&) {
  }
  leave_trusted(LEFT_BY_PANIC);
}

}  // namespace tee
