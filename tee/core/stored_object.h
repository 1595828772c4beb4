// The content of a persistent object and its form in the store.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "tee/crypto/key.h"
#include "tee/device/secret_bytes.h"

namespace tee {

struct stored_object {
  uint32_t type = TEE_TYPE_DATA;  // TEE_TYPE_
  uint32_t max_bits = 0;
  uint32_t usage = 0;
  std::vector<crypto::attribute> attributes;  // empty for pure data objects
  secret_bytes data;
};

// encode: little-endian: u32 version (1), u32 type, u32 max_bits, u32 usage, u32 number of
// attributes, the attributes (u32 id, then u32 a and u32 b, or u32 length and that many bytes, by
// the id's kind), data to the end.
secret_bytes encode(const stored_object& object);

// decode: the inverse; nothing for bytes that encode() does not make.
std::optional<stored_object> decode(std::span<const uint8_t> bytes);

}  // namespace tee
