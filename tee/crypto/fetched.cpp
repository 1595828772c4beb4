// libcrypto's implementations, fetched once.
#include "tee/crypto/fetched.h"

#include <array>
#include <openssl/core_names.h>
#include <string>

#include "tee/crypto/openssl.h"

namespace tee::crypto {
namespace {

struct hash_row {
  const char* name;
  size_t length;
};
constexpr std::array<hash_row, 7> HASHES{{{"", 0},
                                          {"MD5", 16},
                                          {"SHA1", 20},
                                          {"SHA2-224", 28},
                                          {"SHA2-256", 32},
                                          {"SHA2-384", 48},
                                          {"SHA2-512", 64}}};
constexpr std::array<const char*, 5> MODES{"", "ECB", "CBC", "CTR", "GCM"};
constexpr std::array<const char*, 3> KEY_SIZES{"128", "192", "256"};

// Null when libcrypto refuses.
EVP_MAC_CTX* keyless_hmac(EVP_MAC* hmac, const char* digest) {
  mac_ctx_ptr context(EVP_MAC_CTX_new(hmac));
  // The parameter is an input; only its type is not const.
  OSSL_PARAM params[] = {
      OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, const_cast<char*>(digest), 0),
      OSSL_PARAM_construct_end()};
  bool ready = context && EVP_MAC_CTX_set_params(context.get(), params) == 1;
  return ready ? context.release() : nullptr;
}

// Never freed: libcrypto may be gone already when static objects are destroyed.
struct implementations {
  std::array<EVP_MD*, HASHES.size()> digests{};
  std::array<std::array<EVP_CIPHER*, KEY_SIZES.size()>, MODES.size()> ciphers{};
  std::array<EVP_MAC_CTX*, HASHES.size()> hmacs{};  // without keys; copied, never used

  implementations() {
    EVP_MAC* hmac = EVP_MAC_fetch(nullptr, "HMAC", nullptr);
    for (size_t h = 1; h < HASHES.size(); ++h) {
      digests[h] = EVP_MD_fetch(nullptr, HASHES[h].name, nullptr);
      if (hmac) hmacs[h] = keyless_hmac(hmac, HASHES[h].name);
    }
    EVP_MAC_free(hmac);
    for (size_t mode = 1; mode < MODES.size(); ++mode) {
      for (size_t size = 0; size < KEY_SIZES.size(); ++size) {
        std::string name = std::string("AES-") + KEY_SIZES[size] + "-" + MODES[mode];
        ciphers[mode][size] = EVP_CIPHER_fetch(nullptr, name.c_str(), nullptr);
      }
    }
  }
};

const implementations& fetched() {
  static const auto& all = *new implementations;
  return all;
}

}  // namespace

const EVP_MD* digest_of(hash which) {
  const EVP_MD* digest = fetched().digests[static_cast<size_t>(which)];
  must(digest != nullptr, "EVP_MD_fetch");
  return digest;
}

const EVP_CIPHER* cipher_of(block_mode mode, uint32_t key_bits) {
  const EVP_CIPHER* cipher = fetched().ciphers[static_cast<size_t>(mode)][key_bits / 64 - 2];
  must(cipher != nullptr, "EVP_CIPHER_fetch");
  return cipher;
}

// A copy costs half of what setting the digest anew does.
mac_ctx_ptr new_hmac(hash which) {
  const EVP_MAC_CTX* keyless = fetched().hmacs[static_cast<size_t>(which)];
  mac_ctx_ptr context(keyless ? EVP_MAC_CTX_dup(keyless) : nullptr);
  must(context != nullptr, "EVP_MAC_CTX_dup");
  return context;
}

size_t length_of(hash which) {
  return HASHES[static_cast<size_t>(which)].length;
}

}  // namespace tee::crypto
