// Objects: what a TEE_ObjectHandle stands for, transient and persistent alike.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <memory>

#include "tee/crypto/key.h"

namespace tee {

class persistent_stream;  // data stream, identifier and access rights of an open persistent object

struct object {
  uint32_t type = 0;                   // TEE_TYPE_
  uint32_t max_bits = 0;               // largest key it may take
  uint32_t usage = TEE_USAGE_DEFAULT;  // TEE_USAGE_ bits
  // The key, shared with the operations that were given it; null while the object is uninitialised
  // and in pure data objects.
  crypto::key_ptr key{};
  // Null for transient objects. Shared ownership so that only its makers need the definition.
  std::shared_ptr<persistent_stream> stream{};

  bool persistent() const { return stream != nullptr; }
  bool initialized() const { return key || stream; }
};

}  // namespace tee
