// The operations that the adapter knows by their handles: those whose calls a standard platform
// would not take as they come. Every other operation passes by unseen.
#pragma once

#include "ports/adapter/platform_calls.h"
#include "ta/base/heap.h"

namespace keymaster::adapter {

// What an operation is for.
enum class role : uint8_t {
  EXPORT,      // TEE_MODE_EXPORT; no operation of the platform stands behind it
  PSS_SIGN,    // salt codes become lengths
  PSS_VERIFY,  // a raw public operation; the padding is checked here
  RAW,         // TEE_ALG_RSA_NOPAD; results lose their leading zero bytes
};

// known_operation: lives from TEE_AllocateOperation to TEE_FreeOperation. Numbers have no leading
// zeros; they are there once a key is set (export: both, PSS: the modulus).
struct known_operation {
  known_operation* next = nullptr;
  TEE_OperationHandle handle{};
  role purpose{};
  uint32_t digest = 0;  // TEE_ALG_* of a PSS operation's digest
  heap_buffer modulus;
  heap_buffer exponent;
};

// find_operation: the operation behind a handle; null for those that pass by.
[[nodiscard]] known_operation* find_operation(TEE_OperationHandle handle);

}  // namespace keymaster::adapter
