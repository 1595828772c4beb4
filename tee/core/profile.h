// What kind of platform this is to its trusted applications.
#pragma once

namespace tee {

// profile: at first what $TEE_PROFILE says, a list of these words, else a lenient platform.
struct profile {
  // "strict": a call that breaks a rule, or comes to an end that the standard gives it no code for,
  // panics wherever the standard lets it: attributes longer than their object, digests that do not
  // fit the key, unknown parameters, buffers that share memory, client's memory where it must be
  // the trusted application's, no memory for a key. RSA ends at 4096 bits, and memory is zero only
  // where that is promised.
  bool strict = false;
  // "standard" says no: the platform has no cryptography beyond the standard, neither export of
  // public keys nor OAEP identifiers and PSS salt codes of its own (codes are taken for no
  // attribute at all), and results of raw RSA keep their leading zeros. Storage, boot seed and
  // trace stay.
  bool extensions = true;
};

const profile& current_profile();

// set_profile: for tests, between commands.
void set_profile(const profile& wanted);

}  // namespace tee
