#include "support/blob_forge.h"

#include <algorithm>
#include <memory>
#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <stdexcept>

namespace keymaster::test {
namespace {

using client::byte_view;
using client::bytes;

constexpr size_t SALT = 1;
constexpr size_t NONCE = 65;
constexpr size_t TAG = 77;
constexpr size_t CIPHERTEXT = 93;
constexpr int TAG_SIZE = 16;

using cipher_context = std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)>;

void check(int result) {
  if (result != 1) throw std::runtime_error("libcrypto failed, or the blob is not authentic");
}

// AES-256-GCM under HMAC-SHA256(ksk, salt) with the header's nonce.
cipher_context start(byte_view header, byte_view ksk, int encrypt) {
  bytes kk(32);
  unsigned int length = 0;
  HMAC(EVP_sha256(), ksk.data(), static_cast<int>(ksk.size()), header.data() + SALT, NONCE - SALT,
       kk.data(), &length);
  cipher_context context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  check(EVP_CipherInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, kk.data(),
                          header.data() + NONCE, encrypt));
  return context;
}

void process(EVP_CIPHER_CTX* context, byte_view input, uint8_t* output) {
  int length = 0;
  check(EVP_CipherUpdate(context, output, &length, input.data(), static_cast<int>(input.size())));
}

}  // namespace

bytes derived_ksk() {
  return client::from_hex("33221100554477668899aabbccddeeff4b4b4b4b4b4b4b4b4b4b4b4b4b4b4b4b");
}

bytes blob_plaintext(byte_view material, const client::param_set& characteristics) {
  return client::field_writer().field(material).field(characteristics.marshal()).take();
}

bytes hmac_material(byte_view key, uint32_t object_type) {
  const auto bits = static_cast<uint32_t>(8 * key.size());
  return client::field_writer().u32(bits).u32(object_type).raw(key).take();
}

bytes seal(byte_view plaintext, byte_view ksk, uint8_t protection) {
  bytes blob(CIPHERTEXT + plaintext.size());
  blob[0] = protection;
  std::fill(blob.begin() + SALT, blob.begin() + NONCE, uint8_t{0x5A});
  std::fill(blob.begin() + NONCE, blob.begin() + TAG, uint8_t{0xA5});
  const cipher_context gcm = start(blob, ksk, 1);
  if (!plaintext.empty()) process(gcm.get(), plaintext, blob.data() + CIPHERTEXT);
  int length = 0;
  uint8_t none = 0;
  check(EVP_CipherFinal_ex(gcm.get(), &none, &length));
  check(EVP_CIPHER_CTX_ctrl(gcm.get(), EVP_CTRL_AEAD_GET_TAG, TAG_SIZE, blob.data() + TAG));
  return blob;
}

bytes unseal(byte_view blob, byte_view ksk) {
  if (blob.size() < CIPHERTEXT) throw std::runtime_error("too short for a blob");
  const cipher_context gcm = start(blob, ksk, 0);
  bytes plaintext(blob.size() - CIPHERTEXT);
  process(gcm.get(), blob.subspan(CIPHERTEXT), plaintext.data());
  bytes tag(blob.begin() + TAG, blob.begin() + CIPHERTEXT);
  check(EVP_CIPHER_CTX_ctrl(gcm.get(), EVP_CTRL_AEAD_SET_TAG, TAG_SIZE, tag.data()));
  int length = 0;
  uint8_t none = 0;
  check(EVP_CipherFinal_ex(gcm.get(), &none, &length));
  return plaintext;
}

}  // namespace keymaster::test
