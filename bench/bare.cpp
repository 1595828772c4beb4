// Bare libcrypto.
#include "bench/bare.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <openssl/core_names.h>
#include <openssl/rand.h>
#include <stdexcept>

#include "product/values.h"

namespace keymaster::bench {
namespace {

// A key blob: protection, salt, nonce, tag, then the ciphertext.
constexpr size_t SALT_OFFSET = 1;
constexpr size_t SALT_SIZE = 64;
constexpr size_t NONCE_OFFSET = 65;
constexpr size_t NONCE_SIZE = 12;
constexpr size_t TAG_OFFSET = 77;
constexpr size_t TAG_SIZE = 16;
constexpr size_t HEADER_SIZE = 93;
constexpr size_t KEY_SIZE = 32;

std::array<uint8_t, KEY_SIZE> derived_ksk(const TEE_UUID& device_id) {
  std::array<uint8_t, KEY_SIZE> ksk;
  ksk.fill(DERIVED_KSK_FILL_BYTE);
  memcpy(ksk.data(), &device_id, sizeof(device_id));
  return ksk;
}

}  // namespace

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(what);
}

bare_hmac::bare_hmac(view key)
    : algorithm_(EVP_MAC_fetch(nullptr, "HMAC", nullptr)),
      context_(EVP_MAC_CTX_new(algorithm_.get())) {
  char digest[] = "SHA256";
  const OSSL_PARAM params[] = {OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, digest, 0),
                               OSSL_PARAM_construct_end()};
  must(EVP_MAC_init(context_.get(), key.data(), key.size(), params) == 1, "EVP_MAC_init");
}

void bare_hmac::set_key(view key) {
  must(EVP_MAC_init(context_.get(), key.data(), key.size(), nullptr) == 1, "EVP_MAC_init");
}

void bare_hmac::compute(view data, uint8_t* mac) {
  size_t length = 0;
  must(EVP_MAC_init(context_.get(), nullptr, 0, nullptr) == 1 &&
           EVP_MAC_update(context_.get(), data.data(), data.size()) == 1 &&
           EVP_MAC_final(context_.get(), mac, &length, EVP_MAX_MD_SIZE) == 1,
       "EVP_MAC");
}

bare_cipher::bare_cipher(const char* algorithm, bool encrypt)
    : algorithm_(EVP_CIPHER_fetch(nullptr, algorithm, nullptr)), context_(EVP_CIPHER_CTX_new()) {
  must(EVP_CipherInit_ex2(context_.get(), algorithm_.get(), nullptr, nullptr, encrypt ? 1 : 0,
                          nullptr) == 1,
       algorithm);
  EVP_CIPHER_CTX_set_padding(context_.get(), 0);
}

void bare_cipher::start(view key, view nonce) {
  must(EVP_CipherInit_ex2(context_.get(), nullptr, key.empty() ? nullptr : key.data(),
                          nonce.empty() ? nullptr : nonce.data(), -1, nullptr) == 1,
       "EVP_CipherInit_ex2");
}

void bare_cipher::update(view input, uint8_t* output) {
  int length = 0;
  must(EVP_CipherUpdate(context_.get(), output, &length, input.data(),
                        static_cast<int>(input.size())) == 1,
       "EVP_CipherUpdate");
}

void bare_cipher::make_tag(uint8_t* tag) {
  finish();
  must(EVP_CIPHER_CTX_ctrl(context_.get(), EVP_CTRL_AEAD_GET_TAG, TAG_SIZE, tag) == 1, "get tag");
}

void bare_cipher::check_tag(view tag) {
  must(EVP_CIPHER_CTX_ctrl(context_.get(), EVP_CTRL_AEAD_SET_TAG, TAG_SIZE,
                           const_cast<uint8_t*>(tag.data())) == 1,
       "set tag");
  finish();
}

void bare_cipher::finish() {
  uint8_t none[16];
  int length = 0;
  must(EVP_CipherFinal_ex(context_.get(), none, &length) == 1, "EVP_CipherFinal_ex");
}

blob_opener::blob_opener(const TEE_UUID& device_id) : ksk_(derived_ksk(device_id)) {}

void blob_opener::derive(view salt, uint8_t* key) {
  uint8_t mac[EVP_MAX_MD_SIZE];
  ksk_.compute(salt, mac);
  memcpy(key, mac, KEY_SIZE);
}

view blob_opener::open_all(view blob) {
  uint8_t key[KEY_SIZE];
  derive(blob.subspan(SALT_OFFSET, SALT_SIZE), key);
  plaintext_.resize(blob.size() - HEADER_SIZE);
  opening_.start(key, blob.subspan(NONCE_OFFSET, NONCE_SIZE));
  opening_.update(blob.subspan(HEADER_SIZE), plaintext_.data());
  opening_.check_tag(blob.subspan(TAG_OFFSET, TAG_SIZE));
  return plaintext_;
}

view blob_opener::open(view blob) {
  const view plaintext = open_all(blob);
  uint32_t length = 0;
  memcpy(&length, plaintext.data(), sizeof(length));
  return plaintext.subspan(sizeof(length), length);
}

view blob_opener::seal(view plaintext) {
  blob_.resize(HEADER_SIZE + plaintext.size());
  blob_[0] = 0;
  const std::span<uint8_t> header(blob_);
  random_bytes(header.subspan(SALT_OFFSET, SALT_SIZE));
  random_bytes(header.subspan(NONCE_OFFSET, NONCE_SIZE));
  uint8_t key[KEY_SIZE];
  derive(header.subspan(SALT_OFFSET, SALT_SIZE), key);
  sealing_.start(key, header.subspan(NONCE_OFFSET, NONCE_SIZE));
  sealing_.update(plaintext, blob_.data() + HEADER_SIZE);
  sealing_.make_tag(blob_.data() + TAG_OFFSET);
  return blob_;
}

void random_bytes(std::span<uint8_t> to) {
  must(RAND_bytes(to.data(), static_cast<int>(to.size())) == 1, "RAND_bytes");
}

}  // namespace keymaster::bench
