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

void check(int result) {
  if (result != 1) throw std::runtime_error("libcrypto failed, or the blob is not authentic");
}

// AES-256-GCM under HMAC-SHA256(ksk, salt) with the header's nonce. The tag is in the header, too:
// written there when `encrypt` is 1.
bytes apply_gcm(uint8_t* header, byte_view ksk, byte_view input, int encrypt) {
  uint8_t kk[32];
  unsigned int kk_length = 0;
  HMAC(EVP_sha256(), ksk.data(), static_cast<int>(ksk.size()), header + SALT, NONCE - SALT, kk,
       &kk_length);
  const std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)> gcm(EVP_CIPHER_CTX_new(),
                                                                            EVP_CIPHER_CTX_free);
  check(EVP_CipherInit_ex(gcm.get(), EVP_aes_256_gcm(), nullptr, kk, header + NONCE, encrypt));
  bytes output(input.size());
  int length = 0;
  check(EVP_CipherUpdate(gcm.get(), output.data(), &length, input.data(),
                         static_cast<int>(input.size())));
  uint8_t none = 0;
  if (encrypt == 0) check(EVP_CIPHER_CTX_ctrl(gcm.get(), EVP_CTRL_AEAD_SET_TAG, 16, header + TAG));
  check(EVP_CipherFinal_ex(gcm.get(), &none, &length));
  if (encrypt == 1) check(EVP_CIPHER_CTX_ctrl(gcm.get(), EVP_CTRL_AEAD_GET_TAG, 16, header + TAG));
  return output;
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
  bytes blob(CIPHERTEXT);
  blob[0] = protection;
  std::fill(blob.begin() + SALT, blob.begin() + NONCE, uint8_t{0x5A});
  std::fill(blob.begin() + NONCE, blob.begin() + TAG, uint8_t{0xA5});
  const bytes ciphertext = apply_gcm(blob.data(), ksk, plaintext, 1);
  client::append(&blob, ciphertext);
  return blob;
}

bytes unseal(byte_view blob, byte_view ksk) {
  if (blob.size() < CIPHERTEXT) throw std::runtime_error("too short for a blob");
  bytes header = client::copy_of(blob.first(CIPHERTEXT));
  return apply_gcm(header.data(), ksk, blob.subspan(CIPHERTEXT), 0);
}

}  // namespace keymaster::test
