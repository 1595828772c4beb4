// The two clocks of a device, and how tests set them. Times are in milliseconds.
#pragma once

#include <cstdint>

namespace tee {

// system_clock_ms: milliseconds since the device's boot, which lies at `boot_ms` on the machine's
// clock (machine_clock_ms). Never runs backwards within a process.
uint64_t system_clock_ms(uint64_t boot_ms);

// ree_clock_ms: milliseconds since 1970 by the wall clock.
uint64_t ree_clock_ms();

// machine_clock_ms: milliseconds since the machine's start, sleep included; not touched by tests.
uint64_t machine_clock_ms();

namespace host {

// set_clocks: from now on both clocks stand still at these values, for every device of the process.
void set_clocks(uint64_t system_ms, uint64_t ree_ms);

// advance_clocks: moves both clocks forward, whether they stand or run.
void advance_clocks(uint64_t ms);

// use_real_clocks: back to the machine's clocks.
void use_real_clocks();

}  // namespace host
}  // namespace tee
