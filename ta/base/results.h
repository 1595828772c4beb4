#pragma once
#include "ta/base/outcome.h"
#define TEE_FAIL(code, ...) ::keymaster::fail(static_cast<TEE_Result>(code), __VA_ARGS__)
#define KM_REFUSE(code, ...) ::keymaster::refuse(code, __VA_ARGS__)
#define KM_FAIL(km_error, code, ...) \
  (*(km_error) = ::keymaster::refuse(code, __VA_ARGS__), TEE_SUCCESS)
#define trace_error(...) ::keymaster::trace(TEE_TRACE_ERROR, __VA_ARGS__)
#define TRACE_ERROR(...) ::keymaster::trace(TEE_TRACE_ERROR, __VA_ARGS__)
#define TRACE_INFO(...) ::keymaster::trace(TEE_TRACE_INFO, __VA_ARGS__)
#define TRACE_DEBUG(...) ::keymaster::trace(TEE_TRACE_DEBUG, __VA_ARGS__)
namespace keymaster {
[[nodiscard]] constexpr bool failed(TEE_Result res, int32_t km_error) {
  return res != TEE_SUCCESS || km_error != 0;
}
}  // namespace keymaster
