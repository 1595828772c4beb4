// Message digests: MD5 (RFC 1321) and the SHA family (FIPS 180-4).
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/context_pool.h"
#include "tee/crypto/openssl.h"

namespace tee::crypto {

using digest_pool = context_pool<md_ctx_ptr>;

class digest {
 public:
  // Takes a spare context and gives it back; the pool must outlive the digest.
  digest(hash which, digest_pool* spares);
  digest(const digest&) = delete;
  digest& operator=(const digest&) = delete;
  ~digest();

  size_t length() const { return length_; }  // of the result, in bytes
  void update(std::span<const uint8_t> bytes);

  // finish: writes length() bytes; what follows is a new message.
  void finish(uint8_t* result);

 private:
  void restart();

  hash which_;
  digest_pool* spares_;
  size_t length_;
  md_ctx_ptr context_;
  bool ended_;  // the context holds a finished message
};

}  // namespace tee::crypto
