// The one place where a trusted application is ended for a programming error, and the wrapper that
// keeps host exceptions from leaving a C entry point.
#pragma once

#include "tee_internal_api.h"

#include <exception>
#include <new>
#include <type_traits>

namespace tee {

// panic: reports "panic: CALL: MESSAGE" on standard error and ends the trusted application that
// made `call`; today that is the whole process (abort). The message names the argument and the rule
// that was broken, never the content of a buffer.
[[noreturn]] __attribute__((format(printf, 2, 3), cold)) void panic(const char* call,
                                                                    const char* format, ...);

// guarded: runs the body of the API function `call`. Lack of host memory becomes
// TEE_ERROR_OUT_OF_MEMORY where the body returns a result; whatever else the body throws, and lack
// of memory in a call that cannot report it, is a panic.
template <typename Body>
auto guarded(const char* call, Body&& body) noexcept -> decltype(body()) {
  try {
    return body();
  } catch (const std::bad_alloc&) {
    if constexpr (std::is_same_v<decltype(body()), TEE_Result>) return TEE_ERROR_OUT_OF_MEMORY;
    panic(call, "out of host memory");
  } catch (const std::exception& error) {
    panic(call, "%s", error.what());
  }
}

}  // namespace tee
