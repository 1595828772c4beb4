// One digest of the platform, fed in pieces.
#pragma once

#include "ports/adapter/platform_calls.h"
#include "ta/base/bytes.h"

namespace keymaster::adapter {

constexpr size_t MAX_DIGEST_SIZE = 64;
using digest_bytes = uint8_t[MAX_DIGEST_SIZE];

// hasher: begin, which gives the platform's code, any number of updates, finish.
class hasher {
 public:
  hasher() = default;
  hasher(const hasher&) = delete;
  hasher& operator=(const hasher&) = delete;
  ~hasher() {
    if (hash_ != TEE_OperationHandle{}) platform_free_operation(hash_);
  }

  [[nodiscard]] TEE_Result begin(uint32_t algorithm) {
    return platform_allocate_operation(&hash_, algorithm, TEE_MODE_DIGEST, 0);
  }
  void update(byte_view bytes) {
    TEE_DigestUpdate(hash_, bytes.data(), static_cast<tee_size>(bytes.size()));
  }
  [[nodiscard]] TEE_Result finish(digest_bytes* digest) {
    tee_size size = sizeof(*digest);
    return TEE_DigestDoFinal(hash_, nullptr, 0, *digest, &size);
  }

 private:
  TEE_OperationHandle hash_{};
};

}  // namespace keymaster::adapter
