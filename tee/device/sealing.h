// Cryptography of the device folder: randomness, keys derived from the device key, and sealing,
// that is AES-256-GCM (NIST SP 800-38D) with a random nonce.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

#include "tee/device/secret_bytes.h"

namespace tee {

using device_key = secret_bytes;  // 32 bytes
using mac_bytes = std::array<uint8_t, 32>;

constexpr size_t DEVICE_KEY_LENGTH = 32;

// What sealing adds to the content: a 12-byte nonce before it and a 16-byte tag behind it.
constexpr size_t SEAL_OVERHEAD = 12 + 16;

// fill_random: fills `bytes` from libcrypto's generator; throws std::runtime_error when it fails.
void fill_random(std::span<uint8_t> bytes);

// derive_key: the 32-byte key that serves `purpose`: HMAC-SHA256(key, purpose).
device_key derive_key(const device_key& key, std::string_view purpose);

// compute_mac: HMAC-SHA256 of `bytes`. same_mac compares in constant time.
mac_bytes compute_mac(const device_key& key, std::span<const uint8_t> bytes);
bool same_mac(std::span<const uint8_t> a, std::span<const uint8_t> b);

// seal: nonce (12), ciphertext (as long as `content`), tag (16). `bound` is authenticated but not
// contained. Throws std::runtime_error when libcrypto fails.
std::vector<uint8_t> seal(const device_key& key, std::span<const uint8_t> bound,
                          std::span<const uint8_t> content);

// unseal: the content; nothing when `sealed` was not made by seal() with this key and `bound`.
std::optional<secret_bytes> unseal(const device_key& key, std::span<const uint8_t> bound,
                                   std::span<const uint8_t> sealed);

}  // namespace tee
