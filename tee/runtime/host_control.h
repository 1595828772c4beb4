// Control of the host TEE by the process it runs in: live counts, faults, trace, clocks. For tests,
// benchmarks and tools; nothing here is reachable by trusted applications.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>

#include "tee/device/clock.h"

namespace tee::host {

// What a trusted application holds at the moment.
struct live_counts {
  size_t heap_bytes = 0;
  size_t heap_blocks = 0;
  size_t objects = 0;
  size_t operations = 0;
  size_t sessions = 0;
  bool operator==(const live_counts&) const = default;
};

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

// set_trace_sink: where trace lines go; each has its newline and `length` bytes. Null: standard
// error.
using trace_sink = void (*)(void* context, uint32_t level, const char* line, size_t length);
void set_trace_sink(trace_sink sink, void* context);

// set_trace_level: the highest level that is let through, 0 (none) to 4. At first it is
// $TEE_TRACE_LEVEL, or 1.
void set_trace_level(uint32_t level);

// set_block_hook: has every heap block that is freed shown twice: as the trusted application left
// it, and after the heap wiped it. Tests look for secrets in the clear there. Null: none.
enum class block_stage { RELEASED, WIPED };
using block_hook = void (*)(void* context, block_stage stage, const uint8_t* block, size_t size);
void set_block_hook(block_hook hook, void* context);

}  // namespace tee::host
