// UUIDs: text, bytes, random ones.
#include "tee/device/uuid.h"

#include <algorithm>
#include <charconv>
#include <openssl/evp.h>
#include <stdexcept>
#include <string>

#include "tee/device/sealing.h"

namespace tee {

namespace {

constexpr size_t TEXT_LENGTH = 36;
constexpr char DIGITS[] = "0123456789abcdef";

bool is_hyphen_place(size_t i) {
  return i == 8 || i == 13 || i == 18 || i == 23;
}

// Puts the version and the variant of RFC 4122 in place.
TEE_UUID with_version(uuid_bytes bytes, uint8_t version) {
  bytes[6] = static_cast<uint8_t>((bytes[6] & 0x0F) | version << 4);
  bytes[8] = static_cast<uint8_t>((bytes[8] & 0x3F) | 0x80);
  return from_bytes(bytes);
}

}  // namespace

uuid_bytes to_bytes(const TEE_UUID& uuid) {
  uuid_bytes bytes{};
  for (size_t i = 0; i < 4; i++)
    bytes[i] = static_cast<uint8_t>(uuid.timeLow >> (24 - 8 * i));
  for (size_t i = 0; i < 2; i++) {
    bytes[4 + i] = static_cast<uint8_t>(uuid.timeMid >> (8 - 8 * i));
    bytes[6 + i] = static_cast<uint8_t>(uuid.timeHiAndVersion >> (8 - 8 * i));
  }
  for (size_t i = 0; i < 8; i++)
    bytes[8 + i] = uuid.clockSeqAndNode[i];
  return bytes;
}

TEE_UUID from_bytes(const uuid_bytes& bytes) {
  TEE_UUID uuid{};
  for (size_t i = 0; i < 4; i++)
    uuid.timeLow = uuid.timeLow << 8 | bytes[i];
  uuid.timeMid = static_cast<uint16_t>(bytes[4] << 8 | bytes[5]);
  uuid.timeHiAndVersion = static_cast<uint16_t>(bytes[6] << 8 | bytes[7]);
  for (size_t i = 0; i < 8; i++)
    uuid.clockSeqAndNode[i] = bytes[8 + i];
  return uuid;
}

std::string to_text(const TEE_UUID& uuid) {
  std::string text;
  for (uint8_t byte : to_bytes(uuid)) {
    if (is_hyphen_place(text.size())) text += '-';
    text += DIGITS[byte >> 4];
    text += DIGITS[byte & 0xF];
  }
  return text;
}

bool parse_uuid(std::string_view text, TEE_UUID* uuid) {
  if (text.size() != TEXT_LENGTH) return false;
  uuid_bytes bytes{};
  size_t filled = 0;
  for (size_t i = 0; i < TEXT_LENGTH;) {
    if (is_hyphen_place(i)) {
      if (text[i++] != '-') return false;
      continue;
    }
    const char* end = text.data() + i + 2;
    if (std::from_chars(text.data() + i, end, bytes[filled++], 16).ptr != end) return false;
    i += 2;
  }
  *uuid = from_bytes(bytes);
  return true;
}

TEE_UUID new_uuid() {
  uuid_bytes bytes{};
  fill_random(bytes);
  return with_version(bytes, 4);
}

TEE_UUID custom_uuid(const uuid_bytes& bytes) {
  return with_version(bytes, 8);
}

TEE_UUID name_based_uuid(const TEE_UUID& name_space, std::string_view name) {
  const uuid_bytes prefix = to_bytes(name_space);
  std::string input(prefix.begin(), prefix.end());
  input += name;
  std::array<uint8_t, EVP_MAX_MD_SIZE> digest{};
  if (EVP_Digest(input.data(), input.size(), digest.data(), nullptr, EVP_sha1(), nullptr) != 1) {
    throw std::runtime_error("libcrypto failed: EVP_Digest");
  }
  uuid_bytes bytes{};
  std::copy_n(digest.begin(), bytes.size(), bytes.begin());
  return with_version(bytes, 5);
}

}  // namespace tee
