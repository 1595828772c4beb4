// libcrypto's implementations, fetched once.
#include "tee/crypto/fetched.h"

#include <array>
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

// Never freed: libcrypto may be gone already when static objects are destroyed.
struct implementations {
  std::array<EVP_MD*, HASHES.size()> digests{};
  std::array<std::array<EVP_CIPHER*, KEY_SIZES.size()>, MODES.size()> ciphers{};
  EVP_MAC* hmac = EVP_MAC_fetch(nullptr, "HMAC", nullptr);

  implementations() {
    for (size_t h = 1; h < HASHES.size(); ++h) {
      digests[h] = EVP_MD_fetch(nullptr, HASHES[h].name, nullptr);
    }
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

EVP_MAC* hmac_algorithm() {
  must(fetched().hmac != nullptr, "EVP_MAC_fetch");
  return fetched().hmac;
}

const char* name_of(hash which) {
  return HASHES[static_cast<size_t>(which)].name;
}

size_t length_of(hash which) {
  return HASHES[static_cast<size_t>(which)].length;
}

}  // namespace tee::crypto
