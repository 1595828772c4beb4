// Faults on demand: the one check that every call which can fail on a real TEE makes before it
// does anything. Tests arm it through the host's controls.
#pragma once

#include "tee_internal_api.h"

#include <atomic>
#include <cstdint>

namespace tee {

struct fault_state {
  std::atomic<uint64_t> calls{0};    // fallible calls so far
  std::atomic<uint64_t> fail_at{0};  // the value of `calls` at which to fail; 0: never
  std::atomic<TEE_Result> code{TEE_SUCCESS};
  std::atomic<bool> fired{false};
};
extern fault_state faults;

// fire_fault: the armed call has come. Disarms and returns the code.
[[gnu::cold]] TEE_Result fire_fault();

// fault_point: counts one fallible call; TEE_SUCCESS, or the code with which the call is to fail.
// The count is exact while calls come from one thread at a time; a locked increment would cost more
// than most calls' own bookkeeping.
[[nodiscard]] inline TEE_Result fault_point() {
  uint64_t call = faults.calls.load(std::memory_order_relaxed) + 1;
  faults.calls.store(call, std::memory_order_relaxed);
  if (call != faults.fail_at.load(std::memory_order_relaxed)) [[likely]]
    return TEE_SUCCESS;
  return fire_fault();
}

}  // namespace tee
