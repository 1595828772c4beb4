// UUIDs: the 8-4-4-4-12 text form, the 16 bytes in network order (RFC 4122, 4.1.2), and new ones.
#pragma once

#include "tee_internal_api.h"

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

namespace tee {

using uuid_bytes = std::array<uint8_t, 16>;

// to_bytes: the UUID in network order; serves as its key in tables and stores, too.
uuid_bytes to_bytes(const TEE_UUID& uuid);

// from_bytes: the inverse of to_bytes.
TEE_UUID from_bytes(const uuid_bytes& bytes);

// to_text: 36 characters, lower-case hexadecimal.
std::string to_text(const TEE_UUID& uuid);

// parse_uuid: reads the 36-character form, either case; false (and *uuid untouched) for any other
// text.
[[nodiscard]] bool parse_uuid(std::string_view text, TEE_UUID* uuid);

// new_uuid: a random one (RFC 4122 version 4). Throws std::runtime_error without randomness.
TEE_UUID new_uuid();

// name_based_uuid: the one that belongs to a name in a name space (RFC 4122 version 5). Throws
// std::runtime_error when libcrypto fails.
TEE_UUID name_based_uuid(const TEE_UUID& name_space, std::string_view name);

// custom_uuid: the one whose 122 free bits are these (RFC 9562 version 8).
TEE_UUID custom_uuid(const uuid_bytes& bytes);

inline bool same_uuid(const TEE_UUID& a, const TEE_UUID& b) {
  return to_bytes(a) == to_bytes(b);
}

}  // namespace tee
