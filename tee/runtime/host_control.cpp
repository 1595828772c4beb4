// What of the control interface belongs to no single part of the runtime.
#include "tee/runtime/host_control.h"

#include "tee/runtime/ta_host.h"

bool tee::host::counts_of(const TEE_UUID& ta, live_counts* counts) {
  std::shared_ptr<instance> found = find_instance(ta);
  if (!found) return false;
  *counts = found->counts();
  return true;
}
