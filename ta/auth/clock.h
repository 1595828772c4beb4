// The TA's clock: the wall-clock time at which the instance was created, carried on by the system
// time, so that a rich OS that moves its clock later does not move the validity of keys.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

namespace keymaster {

// clock_init: takes the REE time and the system time of now as the clock's bases.
void clock_init();

// get_current_time: the clock's time since 1970; millis is 0 to 999.
void get_current_time(TEE_Time* time);

// current_time_ms: the same in milliseconds, as date tags and token timestamps count.
uint64_t current_time_ms();

}  // namespace keymaster
