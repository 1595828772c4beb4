// The TA's clock.
#include "ta/auth/clock.h"

namespace keymaster {
namespace {

constexpr uint32_t MILLIS_PER_SECOND = 1000;

TEE_Time ree_base;
TEE_Time system_base;

}  // namespace

void clock_init() {
  TEE_GetSystemTime(&system_base);
  TEE_GetREETime(&ree_base);
}

void get_current_time(TEE_Time* time) {
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  // One second is borrowed, since now's milliseconds may be fewer than the base's; up to two whole
  // seconds are carried back.
  const uint32_t millis = ree_base.millis + now.millis + MILLIS_PER_SECOND - system_base.millis;
  time->seconds = ree_base.seconds + (now.seconds - system_base.seconds) - 1;
  time->seconds += millis / MILLIS_PER_SECOND;
  time->millis = millis % MILLIS_PER_SECOND;
}

uint64_t current_time_ms() {
  TEE_Time now{};
  get_current_time(&now);
  return uint64_t{now.seconds} * MILLIS_PER_SECOND + now.millis;
}

}  // namespace keymaster
