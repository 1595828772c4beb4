// The constants of a product. Each is set once: changing the first makes every key that was made
// under it unreadable.
#pragma once

// The byte that fills the derived key storage key's input around the device identifier.
constexpr unsigned char DERIVED_KSK_FILL_BYTE = 0x4B;

// The verified boot key that every root of trust names: the platform offers no other. 32 bytes.
constexpr char VERIFIED_BOOT_KEY[] = "58203947165029384756102938475610";
