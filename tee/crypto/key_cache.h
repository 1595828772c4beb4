// Keys found again: a trusted application that opens its keys anew for every operation populates
// the same key over and over, and what libcrypto prepares at a key's first use (its parsed form, an
// RSA key's blinding, an EC key's group) costs as much as an operation.
#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "tee/crypto/key.h"

namespace tee::crypto {

// The most recently used keys of one instance, by the SHA-256 of type and attributes.
class key_cache {
 public:
  static constexpr size_t SIZE = 16;

  // load: as load_key, but gives the key that is held already for the same type and attributes.
  [[nodiscard]] TEE_Result load(uint32_t type, uint32_t max_bits, std::vector<attribute> attributes,
                                key_ptr* result);

  // add: keeps a key that was generated, which is often populated next.
  void add(const key_ptr& made);

 private:
  using digest = std::array<uint8_t, 32>;
  struct entry {
    digest name;
    key_ptr value;
  };
  digest name_of(uint32_t type, const std::vector<attribute>& attributes);
  void hold(const digest& name, const key_ptr& value);

  std::vector<entry> held_;  // the most recently used first
  md_ctx_ptr context_;
};

}  // namespace tee::crypto
