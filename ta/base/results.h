// The two results of a call: a TEE code is returned, a Keymaster code goes out through `km_error`.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

#include "ta/base/trace.h"

namespace keymaster {

// TEE_FAIL(code, format, ...): traces at error level; the value is `code`.
#define TEE_FAIL(code, ...) (TRACE_ERROR(__VA_ARGS__), static_cast<TEE_Result>(code))

// KM_FAIL(km_error, code, format, ...): traces at error level and sets *km_error; the value is
// TEE_SUCCESS, since the platform did its part.
#define KM_FAIL(km_error, code, ...) (TRACE_ERROR(__VA_ARGS__), *(km_error) = (code), TEE_SUCCESS)

// KM_REFUSE(code, format, ...): traces at error level; the value is the Keymaster code itself. For
// checks that have no TEE result.
#define KM_REFUSE(code, ...) KM_REFUSE_AT(::keymaster::trace_site::here(), code, __VA_ARGS__)

// KM_REFUSE_AT(at, code, format, ...): the same under the caller's function and line.
#define KM_REFUSE_AT(at, code, ...) \
  (::keymaster::trace_error(at, __VA_ARGS__), static_cast<int32_t>(code))

// failed: whether a call with both results failed. 0 is success in both.
[[nodiscard]] constexpr bool failed(TEE_Result res, int32_t km_error) {
  return res != TEE_SUCCESS || km_error != 0;
}

}  // namespace keymaster
