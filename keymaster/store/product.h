// Product constants of key storage. A product sets them once: changing one makes every key that was
// made under it unreadable.
#pragma once

#include <cstdint>

namespace keymaster {

// The byte that fills the derived key storage key's input around the device identifier.
constexpr uint8_t DERIVED_KSK_FILL_BYTE = 0x4B;

}  // namespace keymaster
