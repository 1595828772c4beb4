// Cryptography of the device folder, on libcrypto's EVP interface.
#include "tee/device/sealing.h"

#include <climits>
#include <memory>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/rand.h>
#include <stdexcept>

namespace tee {

namespace {

constexpr size_t NONCE_LENGTH = 12;
constexpr size_t TAG_LENGTH = 16;

struct cipher_context_deleter {
  void operator()(EVP_CIPHER_CTX* context) const { EVP_CIPHER_CTX_free(context); }
};
using cipher_context = std::unique_ptr<EVP_CIPHER_CTX, cipher_context_deleter>;

void require(bool done, const char* step) {
  if (done) return;
  ERR_clear_error();
  throw std::runtime_error(std::string("libcrypto failed: ") + step);
}

int as_int(size_t length) {
  require(length <= INT_MAX, "length");
  return static_cast<int>(length);
}

// A GCM context with key, nonce and bound bytes taken in.
cipher_context start_gcm(bool encrypt, const device_key& key, const uint8_t* nonce,
                         std::span<const uint8_t> bound) {
  require(key.size() == DEVICE_KEY_LENGTH, "key length");
  cipher_context context(EVP_CIPHER_CTX_new());
  require(context != nullptr, "EVP_CIPHER_CTX_new");
  require(EVP_CipherInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, key.data(), nonce,
                            encrypt ? 1 : 0) == 1,
          "EVP_CipherInit_ex");
  int ignored = 0;
  require(
      EVP_CipherUpdate(context.get(), nullptr, &ignored, bound.data(), as_int(bound.size())) == 1,
      "EVP_CipherUpdate");
  return context;
}

}  // namespace

void fill_random(std::span<uint8_t> bytes) {
  require(RAND_bytes(bytes.data(), as_int(bytes.size())) == 1, "RAND_bytes");
}

mac_bytes compute_mac(const device_key& key, std::span<const uint8_t> bytes) {
  mac_bytes mac{};
  size_t length = 0;
  require(EVP_Q_mac(nullptr, "HMAC", nullptr, "SHA256", nullptr, key.data(), key.size(),
                    bytes.data(), bytes.size(), mac.data(), mac.size(), &length) != nullptr &&
              length == mac.size(),
          "EVP_Q_mac");
  return mac;
}

bool same_mac(std::span<const uint8_t> a, std::span<const uint8_t> b) {
  return a.size() == b.size() && CRYPTO_memcmp(a.data(), b.data(), a.size()) == 0;
}

device_key derive_key(const device_key& key, std::string_view purpose) {
  mac_bytes mac =
      compute_mac(key, {reinterpret_cast<const uint8_t*>(purpose.data()), purpose.size()});
  device_key derived(mac.begin(), mac.end());
  OPENSSL_cleanse(mac.data(), mac.size());
  return derived;
}

std::vector<uint8_t> seal(const device_key& key, std::span<const uint8_t> bound,
                          std::span<const uint8_t> content) {
  std::vector<uint8_t> sealed(SEAL_OVERHEAD + content.size());
  fill_random(std::span(sealed).first(NONCE_LENGTH));
  cipher_context context = start_gcm(true, key, sealed.data(), bound);
  uint8_t* out = sealed.data() + NONCE_LENGTH;
  int length = 0;
  if (!content.empty()) {
    require(
        EVP_CipherUpdate(context.get(), out, &length, content.data(), as_int(content.size())) == 1,
        "EVP_CipherUpdate");
  }
  require(EVP_CipherFinal_ex(context.get(), out + length, &length) == 1, "EVP_CipherFinal_ex");
  require(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_GET_TAG, TAG_LENGTH,
                              out + content.size()) == 1,
          "EVP_CTRL_GCM_GET_TAG");
  return sealed;
}

std::optional<secret_bytes> unseal(const device_key& key, std::span<const uint8_t> bound,
                                   std::span<const uint8_t> sealed) {
  if (sealed.size() < SEAL_OVERHEAD) return std::nullopt;
  std::array<uint8_t, TAG_LENGTH> tag{};
  std::copy(sealed.end() - TAG_LENGTH, sealed.end(), tag.begin());
  std::span<const uint8_t> text = sealed.subspan(NONCE_LENGTH, sealed.size() - SEAL_OVERHEAD);
  secret_bytes content(text.size());
  cipher_context context = start_gcm(false, key, sealed.data(), bound);
  int length = 0;
  if (!text.empty()) {
    require(EVP_CipherUpdate(context.get(), content.data(), &length, text.data(),
                             as_int(text.size())) == 1,
            "EVP_CipherUpdate");
  }
  require(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_TAG, TAG_LENGTH, tag.data()) == 1,
          "EVP_CTRL_GCM_SET_TAG");
  uint8_t none = 0;
  if (EVP_CipherFinal_ex(context.get(), &none, &length) != 1) {
    ERR_clear_error();
    return std::nullopt;
  }
  return content;
}

}  // namespace tee
