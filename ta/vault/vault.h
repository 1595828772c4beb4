// The client of the vault, the sibling trusted application that keeps what the factory gave the
// device. Every call is a session of its own; nothing is kept here.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>

namespace keymaster {

// retrieve_key_from_vault: the device's SOTER key, a TLV box (soter/tlv_box.h), into the `size`
// bytes at `buffer`. *used_length receives its length in bytes, on success alone.
// TEE_ERROR_SHORT_BUFFER: no buffer (without asking the vault), or too small a one.
// TEE_ERROR_BAD_PARAMETERS: no used_length. TEE_ERROR_ITEM_NOT_FOUND: nothing is provisioned.
// TEE_ERROR_GENERIC: the vault claims to have written more than it was offered. Otherwise the
// platform's or the vault's code, unchanged.
[[nodiscard]] TEE_Result retrieve_key_from_vault(uint8_t* buffer, size_t size, size_t* used_length);

// retrieve_data_from_vault: the bytes that the vault keeps for this trusted application, likewise.
[[nodiscard]] TEE_Result retrieve_data_from_vault(uint8_t* buffer, size_t size,
                                                  size_t* used_length);

// retrieve_property_from_vault: the property that the four bytes at `request` name: two 16-bit
// little-endian words. *output_length: capacity of `output` on entry, bytes written on success,
// unchanged on failure. TEE_ERROR_BAD_PARAMETERS for a null pointer; otherwise as above.
[[nodiscard]] TEE_Result retrieve_property_from_vault(const uint8_t* request, uint8_t* output,
                                                      size_t* output_length);

}  // namespace keymaster
