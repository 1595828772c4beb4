// Planned failures of API calls.
#include "tee/runtime/faults.h"

#include "tee/runtime/host_control.h"

namespace tee {

fault_state faults;

TEE_Result fire_fault() {
  faults.fail_at.store(0, std::memory_order_relaxed);
  faults.fired.store(true, std::memory_order_relaxed);
  return faults.code.load(std::memory_order_relaxed);
}

namespace host {

void fail_nth_call(uint64_t n, TEE_Result code) {
  faults.fired = false;
  faults.code = code;
  faults.fail_at = faults.calls + n;
}

void clear_fault() {
  faults.fail_at = 0;
  faults.fired = false;
}

bool fault_fired() {
  return faults.fired;
}

uint64_t fallible_calls() {
  return faults.calls;
}

}  // namespace host
}  // namespace tee
