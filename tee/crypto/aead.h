// Authenticated encryption: AES-GCM (NIST SP 800-38D).
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/key.h"

namespace tee::crypto {

class aead {
 public:
  static constexpr size_t MAX_NONCE = 128;  // bytes; libcrypto's bound
  static constexpr size_t USUAL_NONCE = 12;
  static constexpr uint64_t MAX_MESSAGE = (uint64_t{1} << 36) - 32;  // bytes; SP 800-38D, 5.2.1.1

  // valid_tag_length: 96 to 128 bits in steps of 8. Shorter tags, which libcrypto takes, are too
  // easy to forge.
  static constexpr bool valid_tag_length(uint32_t bits) {
    return bits >= 96 && bits <= 128 && bits % 8 == 0;
  }

  aead(key_ptr key, bool encrypt);
  aead(const aead&) = delete;
  aead& operator=(const aead&) = delete;
  ~aead();

  // start: begins a message with a nonce of 1 to MAX_NONCE bytes and a tag of `tag_bits`.
  void start(std::span<const uint8_t> nonce, uint32_t tag_bits);
  size_t tag_length() const { return tag_length_; }  // bytes

  // add_associated_data: authenticates, before the first update.
  void add_associated_data(std::span<const uint8_t> bytes);

  // takes: whether the message may go on with `length` more bytes.
  bool takes(size_t length) const { return length <= MAX_MESSAGE - processed_; }

  // update: writes as many bytes as it reads, as many as it takes; `output` may be the input's own
  // place. Decrypted bytes are not authentic before check_tag.
  void update(std::span<const uint8_t> input, uint8_t* output);

  // make_tag: ends encryption; writes tag_length() bytes.
  void make_tag(uint8_t* tag);

  // check_tag: ends decryption; false when the tag is not tag_length() bytes long or does not
  // belong to the message. Takes the same time whatever the tag's bytes.
  [[nodiscard]] bool check_tag(std::span<const uint8_t> tag);

 private:
  key_ptr key_;
  bool encrypt_;
  size_t tag_length_ = 0;
  uint64_t processed_ = 0;  // bytes of this message
  size_t nonce_length_ =
      USUAL_NONCE;  // for which the context is set; spare ones have the usual one
  cipher_ctx_ptr context_;
};

}  // namespace tee::crypto
