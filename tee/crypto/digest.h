// Message digests: MD5 (RFC 1321) and the SHA family (FIPS 180-4).
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/openssl.h"

namespace tee::crypto {

class digest {
 public:
  explicit digest(hash which);

  size_t length() const { return length_; }  // of the result, in bytes
  void update(std::span<const uint8_t> bytes);

  // finish: writes length() bytes; what follows is a new message.
  void finish(uint8_t* result);

 private:
  void restart();

  size_t length_;
  bool ended_ = false;  // the context holds a finished message
  md_ctx_ptr context_;
};

}  // namespace tee::crypto
