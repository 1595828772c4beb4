// A vault that misbehaves as it is told, and anyone who reports fingerprints: a sibling under
// whatever UUID the build gives it.
#pragma once

#include <cstdint>

// PROGRAM: from now on the vault's command answers like this. Slot 0, memory input: fake_answer and
// the bytes that it writes, as far as they fit. FORWARD: sends slot 0, memory input, to the
// Keymaster as a fingerprint notification, and answers with what that answers.
constexpr uint32_t FAKE_PROGRAM = 200;
constexpr uint32_t FAKE_FORWARD = 201;

struct fake_answer {
  uint32_t question;  // command 2 or 5, or the four bytes of a property request
  uint32_t result;    // of the invocation
  uint32_t times;     // so often; after that success
  uint32_t claims;    // added to the length that it reports
};
