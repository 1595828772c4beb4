// The tables of names, and the text forms of values.
#include "keymaster/client/names.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cinttypes>
#include <cstdio>
#include <ctime>
#include <limits>

namespace keymaster::client {

namespace {

struct tag_row {
  keymaster_tag_t tag;
  std::string_view name;  // with the prefix KM_TAG_
};

struct value_row {
  keymaster_tag_t tag;
  uint32_t value;
  std::string_view name;
  std::string_view published;
};

constexpr std::string_view TAG_PREFIX = "KM_TAG_";

constexpr tag_row TAGS[] = {
#define KM_NAME_TAG(name, value) {value, #name},
    KM_TAG_LIST(KM_NAME_TAG)
#undef KM_NAME_TAG
};

#define KM_VALUE(tag, name, value) \
  { tag, value, name, #value }
constexpr value_row VALUES[] = {
    KM_VALUE(KM_TAG_ALGORITHM, "rsa", KM_ALGORITHM_RSA),
    KM_VALUE(KM_TAG_ALGORITHM, "ec", KM_ALGORITHM_EC),
    KM_VALUE(KM_TAG_ALGORITHM, "aes", KM_ALGORITHM_AES),
    KM_VALUE(KM_TAG_ALGORITHM, "hmac", KM_ALGORITHM_HMAC),
    KM_VALUE(KM_TAG_PURPOSE, "encrypt", KM_PURPOSE_ENCRYPT),
    KM_VALUE(KM_TAG_PURPOSE, "decrypt", KM_PURPOSE_DECRYPT),
    KM_VALUE(KM_TAG_PURPOSE, "sign", KM_PURPOSE_SIGN),
    KM_VALUE(KM_TAG_PURPOSE, "verify", KM_PURPOSE_VERIFY),
    KM_VALUE(KM_TAG_BLOCK_MODE, "ecb", KM_MODE_ECB),
    KM_VALUE(KM_TAG_BLOCK_MODE, "cbc", KM_MODE_CBC),
    KM_VALUE(KM_TAG_BLOCK_MODE, "ctr", KM_MODE_CTR),
    KM_VALUE(KM_TAG_BLOCK_MODE, "gcm", KM_MODE_GCM),
    KM_VALUE(KM_TAG_PADDING, "none", KM_PAD_NONE),
    KM_VALUE(KM_TAG_PADDING, "oaep", KM_PAD_RSA_OAEP),
    KM_VALUE(KM_TAG_PADDING, "pss", KM_PAD_RSA_PSS),
    KM_VALUE(KM_TAG_PADDING, "pkcs1-encrypt", KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
    KM_VALUE(KM_TAG_PADDING, "pkcs1-sign", KM_PAD_RSA_PKCS1_1_5_SIGN),
    KM_VALUE(KM_TAG_PADDING, "pkcs7", KM_PAD_PKCS7),
    KM_VALUE(KM_TAG_DIGEST, "none", KM_DIGEST_NONE),
    KM_VALUE(KM_TAG_DIGEST, "md5", KM_DIGEST_MD5),
    KM_VALUE(KM_TAG_DIGEST, "sha1", KM_DIGEST_SHA1),
    KM_VALUE(KM_TAG_DIGEST, "sha224", KM_DIGEST_SHA_2_224),
    KM_VALUE(KM_TAG_DIGEST, "sha256", KM_DIGEST_SHA_2_256),
    KM_VALUE(KM_TAG_DIGEST, "sha384", KM_DIGEST_SHA_2_384),
    KM_VALUE(KM_TAG_DIGEST, "sha512", KM_DIGEST_SHA_2_512),
    KM_VALUE(KM_TAG_ORIGIN, "generated", KM_ORIGIN_GENERATED),
    KM_VALUE(KM_TAG_ORIGIN, "imported", KM_ORIGIN_IMPORTED),
    KM_VALUE(KM_TAG_EC_CURVE, "p224", KM_EC_CURVE_P_224),
    KM_VALUE(KM_TAG_EC_CURVE, "p256", KM_EC_CURVE_P_256),
    KM_VALUE(KM_TAG_EC_CURVE, "p384", KM_EC_CURVE_P_384),
    KM_VALUE(KM_TAG_EC_CURVE, "p521", KM_EC_CURVE_P_521),
    KM_VALUE(KM_TAG_USER_AUTH_TYPE, "password", KM_AUTH_TYPE_PASSWORD),
    KM_VALUE(KM_TAG_USER_AUTH_TYPE, "fingerprint", KM_AUTH_TYPE_FINGERPRINT),
};
#undef KM_VALUE

char lower(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

// Names are compared without case and without the separators that people place differently.
std::string squash(std::string_view text) {
  std::string result;
  for (char c : text) {
    if (c != '_' && c != '-') result += lower(c);
  }
  return result;
}

std::string lower_case(std::string_view text) {
  std::string result(text);
  std::ranges::transform(result, result.begin(), lower);
  return result;
}

bool is_enumerated(keymaster_tag_t tag) {
  return tag_class(tag) == KM_ENUM || tag_class(tag) == KM_ENUM_REP;
}

std::string mask_names(keymaster_tag_t tag, uint64_t mask) {
  std::string names;
  for (const value_row& row : VALUES) {
    if (row.tag != tag || (mask & row.value) == 0) continue;
    names += names.empty() ? "" : ",";
    names += row.name;
    mask &= ~uint64_t{row.value};
  }
  return mask == 0 && !names.empty() ? names : "";
}

}  // namespace

std::string tag_name(keymaster_tag_t tag) {
  const tag_row* row = std::ranges::find(TAGS, tag, &tag_row::tag);
  if (row != std::end(TAGS)) return lower_case(row->name.substr(TAG_PREFIX.size()));
  char text[16];
  snprintf(text, sizeof(text), "0x%08" PRIx32, tag);
  return text;
}

std::vector<keymaster_tag_t> all_tags() {
  std::vector<keymaster_tag_t> tags;
  for (const tag_row& row : TAGS) {
    if (row.tag != KM_TAG_INVALID) tags.push_back(row.tag);
  }
  return tags;
}

std::optional<keymaster_tag_t> parse_tag(std::string_view text) {
  std::string wanted = squash(text);
  for (const tag_row& row : TAGS) {
    if (wanted == squash(row.name) || wanted == squash(row.name.substr(TAG_PREFIX.size()))) {
      return row.tag;
    }
  }
  std::optional<uint64_t> number = parse_number(text);
  if (!number || *number > std::numeric_limits<keymaster_tag_t>::max()) return std::nullopt;
  return static_cast<keymaster_tag_t>(*number);
}

std::string value_name(keymaster_tag_t tag, uint64_t value) {
  if (tag == KM_TAG_USER_AUTH_TYPE) {
    std::string names = mask_names(tag, value);
    return names.empty() ? std::to_string(value) : names;
  }
  for (const value_row& row : VALUES) {
    if (row.tag == tag && row.value == value) return std::string(row.name);
  }
  return std::to_string(value);
}

std::optional<uint32_t> parse_value(keymaster_tag_t tag, std::string_view text) {
  std::string wanted = squash(text);
  for (const value_row& row : VALUES) {
    if (row.tag == tag && (wanted == squash(row.name) || wanted == squash(row.published))) {
      return row.value;
    }
  }
  std::optional<uint64_t> number = parse_number(text);
  if (!number || *number > std::numeric_limits<uint32_t>::max()) return std::nullopt;
  return static_cast<uint32_t>(*number);
}

std::vector<std::string_view> value_names(keymaster_tag_t tag) {
  std::vector<std::string_view> names;
  for (const value_row& row : VALUES) {
    if (row.tag == tag) names.push_back(row.name);
  }
  return names;
}

std::string describe_value(const param& entry) {
  if (has_blob(entry.tag)) return to_hex(entry.data);
  if (is_enumerated(entry.tag)) return value_name(entry.tag, entry.number);
  if (tag_class(entry.tag) == KM_BOOL) return entry.number != 0 ? "true" : "false";
  if (tag_class(entry.tag) == KM_DATE) return format_date(entry.number);
  return std::to_string(entry.number);
}

std::optional<uint64_t> parse_number(std::string_view text) {
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    base = 16;
    text.remove_prefix(2);
  }
  uint64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<uint64_t> parse_date(std::string_view text) {
  if (std::optional<uint64_t> number = parse_number(text)) return number;
  std::string copy(text);
  for (const char* form : {"%Y-%m-%d", "%Y-%m-%dT%H:%M:%SZ"}) {
    std::tm parts{};
    const char* end = strptime(copy.c_str(), form, &parts);
    if (!end || end != copy.c_str() + copy.size()) continue;
    int day = parts.tm_mday;
    std::time_t seconds = timegm(&parts);
    // timegm carries the 31st of a shorter month into the next one.
    if (seconds < 0 || parts.tm_mday != day) return std::nullopt;
    return static_cast<uint64_t>(seconds) * 1000;
  }
  return std::nullopt;
}

std::string format_date(uint64_t milliseconds) {
  constexpr uint64_t END_OF_9999 = 253402300800000;
  if (milliseconds >= END_OF_9999) return std::to_string(milliseconds);
  auto seconds = static_cast<std::time_t>(milliseconds / 1000);
  std::tm parts{};
  gmtime_r(&seconds, &parts);
  char date[32];
  size_t length = strftime(date, sizeof(date), "%Y-%m-%dT%H:%M:%S", &parts);
  char fraction[16];
  snprintf(fraction, sizeof(fraction), ".%03uZ", static_cast<unsigned>(milliseconds % 1000));
  return std::string(date, length) + fraction;
}

uint32_t digest_bits(uint64_t digest) {
  constexpr std::array<uint32_t, 7> BITS = {0, 128, 160, 224, 256, 384, 512};
  return digest < BITS.size() ? BITS[static_cast<size_t>(digest)] : 0;
}

}  // namespace keymaster::client
