// TEE Internal Core API: cancellation, and the wait that it ends.
#include "tee/core/cancellation.h"

#include "tee_internal_api.h"

#include <algorithm>
#include <utility>

#include "tee/core/instance.h"

using tee::cancellation;
using tee::current_instance;
using tee::guarded;

namespace {

// Waits though the caller may give up; a trusted application that then waits on holds up all
// others for nothing.
TEE_Result wait_masked(const char* call, cancellation::clock::time_point end,
                       const cancellation* asked) {
  if (tee::sleep_until(end, asked)) return TEE_SUCCESS;
  const auto last = cancellation::clock::now() + tee::runaway_grace();
  if (!tee::sleep_until(std::min(end, last), nullptr) || last < end) {
    tee::panic(call, "waits on, masked, after its caller gave up");
  }
  return TEE_SUCCESS;
}

}  // namespace

bool TEE_GetCancellationFlag() {
  constexpr const char* CALL = "TEE_GetCancellationFlag";
  return guarded(CALL, [&] {
    const cancellation* heard = current_instance(CALL).heard();
    return heard != nullptr && heard->requested();
  });
}

bool TEE_UnmaskCancellation() {
  constexpr const char* CALL = "TEE_UnmaskCancellation";
  return guarded(CALL,
                 [&] { return std::exchange(current_instance(CALL).cancellation_masked, false); });
}

bool TEE_MaskCancellation() {
  constexpr const char* CALL = "TEE_MaskCancellation";
  return guarded(CALL,
                 [&] { return std::exchange(current_instance(CALL).cancellation_masked, true); });
}

TEE_Result TEE_Wait(uint32_t timeout) {
  constexpr const char* CALL = "TEE_Wait";
  return guarded(CALL, [&]() -> TEE_Result {
    const tee::instance& caller = current_instance(CALL);
    const auto end = tee::after(timeout);
    if (caller.cancellation_masked) return wait_masked(CALL, end, caller.asked());
    return tee::sleep_until(end, caller.heard()) ? TEE_SUCCESS : TEE_ERROR_CANCEL;
  });
}
