// UUIDs: text, bytes, random ones.
#include "tee/device/uuid.h"

#include <charconv>

#include "tee/device/sealing.h"

namespace tee {

namespace {

constexpr size_t TEXT_LENGTH = 36;
constexpr char DIGITS[] = "0123456789abcdef";

bool is_hyphen_place(size_t i) {
  return i == 8 || i == 13 || i == 18 || i == 23;
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
  bytes[6] = static_cast<uint8_t>((bytes[6] & 0x0F) | 0x40);
  bytes[8] = static_cast<uint8_t>((bytes[8] & 0x3F) | 0x80);
  return from_bytes(bytes);
}

}  // namespace tee
