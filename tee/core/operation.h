// Operations: what a TEE_OperationHandle stands for.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <variant>

#include "tee/crypto/aead.h"
#include "tee/crypto/algorithms.h"
#include "tee/crypto/block_cipher.h"
#include "tee/crypto/digest.h"
#include "tee/crypto/hmac.h"
#include "tee/crypto/key.h"

namespace tee {

struct operation {
  enum class progress {
    INITIAL,     // no message under way; all but digests need a key to go on
    INITIALIZED  // between init and final
  };

  // A digest can begin at once; the others wait for their key.
  operation(const crypto::algorithm& row, uint32_t mode_id, uint32_t max_key_bits,
            crypto::digest_pool* digests)
      : algorithm(row), mode(mode_id), max_bits(max_key_bits) {
    if (row.kind == crypto::family::DIGEST) engine.emplace<crypto::digest>(row.digest, digests);
  }

  const crypto::algorithm& algorithm;
  uint32_t mode;      // TEE_MODE_
  uint32_t max_bits;  // largest key it takes; 0: no limit
  crypto::key_ptr key{};
  progress state = progress::INITIAL;
  bool payload_started = false;  // AE: no more associated data
  // The running computation of a digest, MAC, cipher or AE operation; nothing for asymmetric ones,
  // and nothing before the key is set.
  std::variant<std::monostate, crypto::digest, crypto::hmac, crypto::block_cipher, crypto::aead>
      engine{};
};

}  // namespace tee
