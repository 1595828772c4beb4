// Keys found again: a trusted application that opens its keys anew for every operation populates
// the same key over and over, and what libcrypto prepares at a key's first use (its parsed form, an
// RSA key's blinding, an EC key's group, a cipher's schedule) costs as much as an operation.
#pragma once

#include <cstdint>
#include <vector>

#include "tee/crypto/key.h"

namespace tee::crypto {

// The most recently used keys of one instance, found by type and attributes.
class key_cache {
 public:
  static constexpr size_t SIZE = 16;

  // load: as load_key, but gives the key that is held already for the same type and attributes.
  // Bytes are compared in constant time.
  [[nodiscard]] TEE_Result load(const attribute_list& attributes, uint32_t max_bits,
                                key_ptr* result);

  // add: keeps a key that was generated, which is often populated next.
  void add(const key_ptr& made);

 private:
  std::vector<key_ptr> held_;  // the most recently used first
};

}  // namespace tee::crypto
