// Control of the host TEE by the process it runs in.
#include "tee/controls/host_control.h"

#include <memory>

#include "tee/core/faults.h"
#include "tee/host/ta_host.h"

namespace tee::host {

bool counts_of(const TEE_UUID& ta, live_counts* counts) {
  std::shared_ptr<instance> found = find_instance(ta);
  if (!found) return false;
  *counts = found->counts();
  return true;
}

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

}  // namespace tee::host
