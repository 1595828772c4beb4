// Planned failures of API calls.
#include "tee/core/faults.h"

namespace tee {

fault_state faults;

TEE_Result fire_fault() {
  faults.fail_at.store(0, std::memory_order_relaxed);
  faults.fired.store(true, std::memory_order_relaxed);
  return faults.code.load(std::memory_order_relaxed);
}

}  // namespace tee
