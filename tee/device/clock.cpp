// The two clocks of a device, and how tests set them.
#include "tee/device/clock.h"

#include <ctime>
#include <mutex>

namespace tee {

namespace {

struct clock_setting {
  bool fixed = false;      // both stand still at the two values
  uint64_t system_ms = 0;  // running clocks: what advance_clocks added
  uint64_t ree_ms = 0;
};

std::mutex setting_mutex;
clock_setting setting;

clock_setting current_setting() {
  std::lock_guard lock(setting_mutex);
  return setting;
}

uint64_t read_clock_ms(clockid_t clock) {
  timespec now{};
  clock_gettime(clock, &now);
  return static_cast<uint64_t>(now.tv_sec) * 1000 + static_cast<uint64_t>(now.tv_nsec) / 1000000;
}

}  // namespace

uint64_t machine_clock_ms() {
  return read_clock_ms(CLOCK_BOOTTIME);
}

uint64_t system_clock_ms(uint64_t boot_ms) {
  clock_setting now = current_setting();
  return now.fixed ? now.system_ms : machine_clock_ms() - boot_ms + now.system_ms;
}

uint64_t ree_clock_ms() {
  clock_setting now = current_setting();
  return now.fixed ? now.ree_ms : read_clock_ms(CLOCK_REALTIME) + now.ree_ms;
}

namespace host {

void set_clocks(uint64_t system_ms, uint64_t ree_ms) {
  std::lock_guard lock(setting_mutex);
  setting = {true, system_ms, ree_ms};
}

void advance_clocks(uint64_t ms) {
  std::lock_guard lock(setting_mutex);
  setting.system_ms += ms;
  setting.ree_ms += ms;
}

void use_real_clocks() {
  std::lock_guard lock(setting_mutex);
  setting = {};
}

}  // namespace host
}  // namespace tee
