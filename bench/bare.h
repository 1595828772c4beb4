// The yardstick: what the trusted application does, written directly on libcrypto as one would
// without a TEE. Algorithms are fetched once and contexts are kept, so that it is not slowed down
// by what a careful program avoids. Every function throws std::runtime_error when libcrypto fails.
#pragma once

#include "tee_internal_api.h"

#include <memory>
#include <openssl/evp.h>
#include <span>
#include <vector>

namespace keymaster::bench {

template <auto Free>
struct freed_by {
  template <class T>
  void operator()(T* object) const {
    Free(object);
  }
};
using cipher_ptr = std::unique_ptr<EVP_CIPHER, freed_by<EVP_CIPHER_free>>;
using cipher_ctx_ptr = std::unique_ptr<EVP_CIPHER_CTX, freed_by<EVP_CIPHER_CTX_free>>;
using mac_ptr = std::unique_ptr<EVP_MAC, freed_by<EVP_MAC_free>>;
using mac_ctx_ptr = std::unique_ptr<EVP_MAC_CTX, freed_by<EVP_MAC_CTX_free>>;

using view = std::span<const uint8_t>;

void must(bool done, const char* what);

// bare_hmac: HMAC-SHA256.
class bare_hmac {
 public:
  explicit bare_hmac(view key);
  // set_key: replaces the key; at most 64 bytes.
  void set_key(view key);
  // compute: the MAC of `data`, 32 bytes, into `mac`.
  void compute(view data, uint8_t* mac);

 private:
  mac_ptr algorithm_;
  mac_ctx_ptr context_;
};

// bare_cipher: AES in one mode and direction, without padding.
class bare_cipher {
 public:
  bare_cipher(const char* algorithm, bool encrypt);
  // start: begins a message; an empty key leaves the one that is set.
  void start(view key, view nonce);
  // update: all of `input`, as many bytes into `output`.
  void update(view input, uint8_t* output);
  // Ends a GCM message: makes the 16-byte tag, or checks it.
  void make_tag(uint8_t* tag);
  void check_tag(view tag);
  // finish: ends a message of any other mode.
  void finish();

 private:
  cipher_ptr algorithm_;
  cipher_ctx_ptr context_;
};

// blob_opener: opens and makes key blobs of one device without replay-protected storage.
class blob_opener {
 public:
  explicit blob_opener(const TEE_UUID& device_id);
  // open: the key material; open_all: the whole plaintext. The view lives until the next call.
  view open(view blob);
  view open_all(view blob);
  // seal: the blob around a plaintext of lengths, key material and characteristics.
  view seal(view plaintext);

 private:
  void derive(view salt, uint8_t* key);

  bare_hmac ksk_;
  bare_cipher opening_{"AES-256-GCM", false};
  bare_cipher sealing_{"AES-256-GCM", true};
  std::vector<uint8_t> plaintext_;
  std::vector<uint8_t> blob_;
};

// random_bytes: fills `to` from libcrypto's generator.
void random_bytes(std::span<uint8_t> to);

}  // namespace keymaster::bench
