// The name of a persistent object, and one that fails its check.
#pragma once

#include "tee_internal_api.h"

#include <compare>
#include <cstdint>
#include <string>
#include <vector>

#include "tee/device/uuid.h"

namespace tee {

struct object_name {
  uint32_t storage;         // TEE_STORAGE_PRIVATE or TEE_STORAGE_RPMB
  uuid_bytes ta;            // the trusted application that owns it
  std::vector<uint8_t> id;  // 0 to TEE_OBJECT_ID_MAX_LEN arbitrary bytes

  friend auto operator<=>(const object_name&, const object_name&) = default;
};

struct damaged_object {
  object_name name;
  std::string fault;  // a clause for people: "its row is missing"
};

}  // namespace tee
