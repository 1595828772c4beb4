// AES in the modes ECB, CBC and CTR (FIPS 197, NIST SP 800-38A), without padding.
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/key.h"

namespace tee::crypto {

class block_cipher {
 public:
  block_cipher(key_ptr key, block_mode mode, bool encrypt);
  block_cipher(const block_cipher&) = delete;
  block_cipher& operator=(const block_cipher&) = delete;
  ~block_cipher();

  // iv_length: what start() needs: AES_BLOCK bytes, none for ECB.
  size_t iv_length() const { return mode_ == block_mode::ECB ? 0 : AES_BLOCK; }

  // start: begins a message; the one under way, if any, is dropped.
  void start(std::span<const uint8_t> iv);

  // held: bytes of an incomplete block that wait inside; always 0 for CTR.
  size_t held() const { return held_; }

  // output_size: what update() writes for `length` bytes of input: each block as soon as it is
  // complete.
  size_t output_size(size_t length) const;

  // update: writes output_size(input.size()) bytes to `output`, which may be the input's own place
  // while nothing is held, and does not overlap it otherwise.
  void update(std::span<const uint8_t> input, uint8_t* output);

 private:
  uint64_t use() const { return static_cast<uint64_t>(mode_) * 2 + (encrypt_ ? 1 : 0); }

  key_ptr key_;
  block_mode mode_;
  bool encrypt_;
  size_t held_ = 0;
  cipher_ctx_ptr context_;
};

// update_in_chunks: EVP_CipherUpdate, whose lengths are ints, over any length. A null output feeds
// associated data.
void update_in_chunks(EVP_CIPHER_CTX* context, std::span<const uint8_t> input, uint8_t* output);

}  // namespace tee::crypto
