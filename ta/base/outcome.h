// How a step ended: a TEE code for faults of buffers and of the platform, a Keymaster code for
// faults of keys and requests. Both can be set.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

#include "ta/base/trace.h"
#include "ta/params/tags.h"

namespace keymaster {

// outcome: both results of a step; 0 is success in each. Either code turns into one by itself.
struct [[nodiscard]] outcome {
  TEE_Result tee = TEE_SUCCESS;
  keymaster_error_t error = KM_ERROR_OK;

  constexpr outcome() = default;
  constexpr outcome(TEE_Result code) : tee(code) {}           // NOLINT(google-explicit-constructor)
  constexpr outcome(keymaster_error_t code) : error(code) {}  // NOLINT(google-explicit-constructor)
  constexpr outcome(TEE_Result code, keymaster_error_t km) : tee(code), error(km) {}
};
static_assert(sizeof(outcome) == 8);

// DONE: what a step returns that did its work.
constexpr outcome DONE;

// failed: whether a step failed.
[[nodiscard]] constexpr bool failed(outcome how) {
  return how.tee != TEE_SUCCESS || how.error != KM_ERROR_OK;
}

// fail, refuse: trace at error level; the value is `code`. `return` stands before them.
[[nodiscard]] TEE_Result fail(with_line<TEE_Result> code, const char* format, ...)
    __attribute__((format(printf, 2, 3), cold));
[[nodiscard]] keymaster_error_t refuse(with_line<keymaster_error_t> code, const char* format, ...)
    __attribute__((format(printf, 2, 3), cold));

#ifdef __clang_analyzer__
// It enters no function with C's variable arguments: these tell it that a maker's value is the
// code.
template <class... T>
TEE_Result fail(TEE_Result code, const char*, T...) {
  return code;
}
template <class... T>
keymaster_error_t refuse(keymaster_error_t code, const char*, T...) {
  return code;
}
#endif

// checked: the result of a platform call; a failure is traced as "<call> failed with 0x%08x".
[[nodiscard]] TEE_Result checked(with_line<TEE_Result> res, const char* call);

// TRY(step): leaves the function with the step's result if it failed. The step gives an outcome or
// one of its codes.
#define TRY(...) \
  if (const auto tried = (__VA_ARGS__); ::keymaster::failed(tried)) return tried

}  // namespace keymaster
