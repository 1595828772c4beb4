// HMAC (RFC 2104).
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/key.h"

namespace tee::crypto {

class hmac {
 public:
  hmac(key_ptr key, hash which);
  hmac(const hmac&) = delete;
  hmac& operator=(const hmac&) = delete;
  ~hmac();

  size_t length() const { return length_; }  // of the result, in bytes

  // start: begins a message; the one under way, if any, is dropped.
  void start();
  void update(std::span<const uint8_t> bytes);

  // finish: writes length() bytes. A new message needs start().
  void finish(uint8_t* result);

 private:
  key_ptr key_;
  hash which_;
  size_t length_;
  mac_ctx_ptr context_;
};

}  // namespace tee::crypto
