// The boot of a device: its secret seed and when it began.
#pragma once

#include <cstdint>

#include "tee/device/folder.h"
#include "tee/device/secret_bytes.h"

namespace tee {

struct boot_record {
  secret_bytes seed;  // device::BOOT_SEED_LENGTH bytes
  uint64_t boot_ms;   // on the machine's clock (machine_clock_ms)
};

// start_boot: begins a new boot of the device: boot.json holds a new seed and the time.
// Throws device_error.
boot_record start_boot(const device_folder& folder);

// current_boot: the boot that boot.json tells of, or a new one when the machine was started anew
// since. Throws device_error: DAMAGED when the file is missing or malformed.
boot_record current_boot(const device_folder& folder);

}  // namespace tee
