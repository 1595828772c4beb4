// What the faulty TA does wrong on demand. It is built under several identities, which differ in
// the rules that they declare for their instances.
#pragma once

#include "tee_internal_api.h"

namespace faulty {

constexpr TEE_UUID identity(uint8_t kind) {
  return {0x1f3c5e70, 0x0010, 0x4a00, {0x80, 0, 0, 0, 0, 0, 0, kind}};
}
constexpr TEE_UUID SHARED = identity(1);     // says nothing
constexpr TEE_UUID OTHER = identity(2);      // says nothing
constexpr TEE_UUID SEPARATE = identity(3);   // an instance for each session
constexpr TEE_UUID EXCLUSIVE = identity(4);  // one session at a time
constexpr TEE_UUID PASSING = identity(5);    // ends with the last session

// Slot 0 of a command, a value, is what most take. An open entry point that has it, as input, does
// command a with b.
enum command : uint32_t {
  COUNT = 1,            // value out: how often the instance was asked, this time included
  HOLD = 2,             // keeps a heap block, an object, an operation and a session with OTHER
  PANIC = 3,            // with code b
  STALE = 4,            // frees an address that is no block
  NULL_ACCESS = 5,      //
  DIVIDE = 6,           //
  RECURSE = 7,          // without end
  RECURSE_CALLING = 8,  // likewise, and calls the TEE all the way down
  LOOP = 9,             // for ever
  LOOP_CALLING = 10,    // for ever, calling the TEE
  WAIT = 11,            // b milliseconds, unmasked
  WAIT_MASKED = 12,     // likewise, masked
  POLL = 13,            // until the cancellation flag shows, unmasked: TEE_ERROR_CANCEL
  CALL_OTHER = 14,      // has OTHER do command b, asked to end after 20 ms; gives its result
  PANIC_AT_CLOSE = 15,  // of this session
};

}  // namespace faulty
