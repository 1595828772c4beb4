// The platform's extensions that concern the device and its output: boot seed, replay-protected
// storage, trace.
#include "tee_extensions.h"

#include <algorithm>
#include <unistd.h>

#include "tee/api/arguments.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/trace.h"

using tee::current_instance;
using tee::fault_point;

TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state) {
  constexpr const char* CALL = "TEE_RPMB_MakeFileSystem";
  return tee::guarded(CALL, [&]() -> TEE_Result {
    tee::device& dev = current_instance(CALL).dev();
    if (!state) tee::panic(CALL, "state is null");
    *state = 0;
    if (TEE_Result fault = fault_point()) return fault;
    if (!dev.has_rpmb()) return TEE_ERROR_NOT_SUPPORTED;  // made with the device if it has one
    *state = 1;
    return TEE_SUCCESS;
  });
}

TEE_Result GetBootSeed(void* seed, size_t length) {
  constexpr const char* CALL = "GetBootSeed";
  return tee::guarded(CALL, [&]() -> TEE_Result {
    auto boot_seed = current_instance(CALL).dev().boot_seed();
    tee::input_bytes(CALL, "seed", seed, length);
    if (TEE_Result fault = fault_point()) return fault;
    if (length > boot_seed.size()) return TEE_ERROR_BAD_PARAMETERS;
    std::copy_n(boot_seed.begin(), length, static_cast<uint8_t*>(seed));
    return TEE_SUCCESS;
  });
}

uint32_t TEE_TraceThreshold() {
  return tee::trace_threshold();
}

uint32_t TEE_TraceThread() {
  thread_local const auto THREAD = static_cast<uint32_t>(gettid());
  return THREAD;
}

void TEE_TraceWrite(uint32_t level, const char* line, size_t length) {
  tee::write_trace(level, line, length);
}
