// What the echo TA offers. It is built twice, under two identities, so that one can call the other.
#pragma once

#include "tee_internal_api.h"

namespace echo {

constexpr TEE_UUID FIRST = {0x1f3c5e70, 0x0001, 0x4a00, {0x80, 0, 0, 0, 0, 0, 0, 1}};
constexpr TEE_UUID SECOND = {0x1f3c5e70, 0x0002, 0x4a00, {0x80, 0, 0, 0, 0, 0, 0, 2}};

enum command : uint32_t {
  // Slot 0, value inout: a and b are exchanged. Slot 1, memory input; slot 2, memory output or
  // inout: the input's bytes, SHORT_BUFFER when they do not fit. Slot 3, value output: as found at
  // entry, with 1 added to a.
  MIRROR = 1,
  // Slot 0, memory input: UUIDs, one behind the other, of trusted applications to call in turn,
  // each with the rest of the list. Slot 1, memory output (64): the client identity, as text, that
  // the last one sees; the other ones' results are passed on. Slot 2, value output: the origin of
  // that.
  RELAY = 2,
  // Opens a session with the other identity and keeps it.
  KEEP_SESSION = 3,
  // Leaves a heap block of 100 bytes behind.
  LEAK = 4,
};

}  // namespace echo
