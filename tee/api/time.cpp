// TEE_GetSystemTime, TEE_GetREETime: the device's two clocks.
#include "tee_internal_api.h"

#include "tee/api/arguments.h"
#include "tee/core/instance.h"

namespace {

TEE_Time* checked(const char* call, TEE_Time* time) {
  if (!time) tee::panic(call, "time is null");
  tee::require_own_output(call, "time", time, sizeof(*time));
  return time;
}

// Seconds wrap at 32 bits, as the type has them.
TEE_Time split(uint64_t milliseconds) {
  return {static_cast<uint32_t>(milliseconds / 1000), static_cast<uint32_t>(milliseconds % 1000)};
}

}  // namespace

void TEE_GetSystemTime(TEE_Time* time) {
  constexpr const char* CALL = "TEE_GetSystemTime";
  tee::guarded(
      CALL, [&] { *checked(CALL, time) = split(tee::current_instance(CALL).dev().system_ms()); });
}

void TEE_GetREETime(TEE_Time* time) {
  constexpr const char* CALL = "TEE_GetREETime";
  tee::guarded(CALL,
               [&] { *checked(CALL, time) = split(tee::current_instance(CALL).dev().ree_ms()); });
}
