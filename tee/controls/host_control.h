// Control of the host TEE by the process it runs in: profile, live counts, faults, trace, clocks.
// For tests, benchmarks and tools; nothing here is reachable by trusted applications.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

#include "tee/core/heap.h"
#include "tee/core/live_counts.h"
#include "tee/core/panic.h"
#include "tee/core/profile.h"
#include "tee/core/trace.h"
#include "tee/device/clock.h"
#include "tee/host/survival.h"

namespace tee::host {

// Blocks that a trusted application frees (heap.h), and trace lines (trace.h).
using tee::block_hook;
using tee::block_stage;
using tee::set_block_hook;
using tee::set_trace_level;
using tee::set_trace_sink;
using tee::trace_sink;

using tee::live_counts;

// What kind of platform trusted applications find (profile.h).
using tee::current_profile;
using tee::profile;
using tee::set_profile;

// For processes that run trusted applications only (survival.h); panics that end the process.
using tee::end_process_on_panic;
using tee::set_runaway_grace;
using tee::survive_faults;

// counts_of: what the instance of `ta` holds; false (and *counts untouched) when none is alive.
// Call it while no command runs in that instance.
[[nodiscard]] bool counts_of(const TEE_UUID& ta, live_counts* counts);

// fail_nth_call: the n-th fallible call from now (1 = the next) fails with `code`, once.
// Allocations then give null, whatever the code. clear_fault disarms and forgets whether it fired.
void fail_nth_call(uint64_t n, TEE_Result code);
void clear_fault();

// fault_fired: whether the armed call has come since fail_nth_call.
bool fault_fired();

// fallible_calls: running count of calls that can fail.
uint64_t fallible_calls();

}  // namespace tee::host
