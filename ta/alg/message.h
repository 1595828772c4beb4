// The data of an asymmetric operation: hashed as it comes, or kept until finish.
#pragma once

#include "ta/base/tee_handles.h"
#include "ta/params/param_set.h"

namespace keymaster {

// digest_t: what belongs to one hash function.
struct digest_t {
  uint32_t digest;     // KM_DIGEST_*
  uint32_t algorithm;  // TEE_ALG_*
  size_t size;         // bytes
  size_t info_size;    // bytes of a DigestInfo in front of the digest (RFC 8017, 9.2)
};

// find_digest: the row of a KM_DIGEST_* value; null for KM_DIGEST_NONE and unknown ones.
const digest_t* find_digest(uint32_t digest);

// message_t: a zero-filled buffer, of which the first `length` bytes are held: the data itself or,
// once finish_hash has run, its digest.
struct message_t {
  tee_operation hash;  // none when the data itself is kept
  heap_buffer buffer;
  size_t length = 0;
  uint32_t digest = KM_DIGEST_NONE;

  bool is_hashed() const { return bool(hash); }
  byte_view data() const { return buffer.view().first(length); }
  size_t room() const { return buffer.size() - length; }

  // start_hash: makes `hash` for `digest`, which find_digest must know.
  [[nodiscard]] TEE_Result start_hash();
  // append: hashes `input`, or keeps it: then it must fit the room.
  void append(byte_view input);
  // finish_hash: puts the digest into the buffer. TEE_ERROR_SHORT_BUFFER: the buffer is shorter.
  [[nodiscard]] TEE_Result finish_hash();
};

// sign_digest: signs `digest` into `signature`, which has room for it and is cut to what was made.
[[nodiscard]] TEE_Result sign_digest(const tee_operation& main,
                                     std::span<const TEE_Attribute> params, byte_view digest,
                                     heap_buffer* signature);

// verify_digest: KM_ERROR_VERIFICATION_FAILED for every signature that is not a good one.
outcome verify_digest(const tee_operation& main, std::span<const TEE_Attribute> params,
                      byte_view digest, byte_view signature);

}  // namespace keymaster
