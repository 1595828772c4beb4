// Names of tags and enumeration values, for people: on command lines, in JSON, in listings.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "keymaster/client/param_set.h"

namespace keymaster::client {

// tag_name: "key_size" for KM_TAG_KEY_SIZE; "0x30001234" for a tag without a name.
std::string tag_name(keymaster_tag_t tag);

// all_tags: every tag with a name, in the order of the numbers' list.
std::vector<keymaster_tag_t> all_tags();

// parse_tag: the tag with that name: "key_size", "KEY_SIZE", "KM_TAG_KEY_SIZE" or its number
// ("0x30000003"); nothing for another text.
std::optional<keymaster_tag_t> parse_tag(std::string_view text);

// value_name: the short name of an enumeration tag's value ("sha256" for KM_TAG_DIGEST 4), or its
// decimal digits when it has none. KM_TAG_USER_AUTH_TYPE is a mask: "password,fingerprint".
std::string value_name(keymaster_tag_t tag, uint64_t value);

// parse_value: the enumeration value with that name ("sha256", "sha-256", "KM_DIGEST_SHA_2_256") or
// number; nothing for another text.
std::optional<uint32_t> parse_value(keymaster_tag_t tag, std::string_view text);

// value_names: the short names that parse_value takes for a tag; empty when it is not enumerated.
std::vector<std::string_view> value_names(keymaster_tag_t tag);

// describe_value: a parameter's value as text: enumerations by name, dates as
// "2026-01-31T12:00:00.000Z", booleans as "true", bytes in hexadecimal, numbers in decimal.
std::string describe_value(const param& entry);

// parse_number: an unsigned number, decimal or hexadecimal with 0x; nothing for another text.
std::optional<uint64_t> parse_number(std::string_view text);

// parse_date: milliseconds since 1970 of "2026-01-31", "2026-01-31T12:00:00Z" (ISO 8601, UTC) or of
// a plain number of milliseconds; nothing for another text.
std::optional<uint64_t> parse_date(std::string_view text);

// format_date: the inverse of parse_date, with milliseconds; the plain number beyond the year 9999.
std::string format_date(uint64_t milliseconds);

// digest_bits: length of a digest's output in bits; 0 for KM_DIGEST_NONE and unknown digests.
uint32_t digest_bits(uint64_t digest);

}  // namespace keymaster::client
