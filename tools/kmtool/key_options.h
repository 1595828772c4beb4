// The options that describe a key, and the description that they make.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "keymaster/client/param_set.h"
#include "options.h"
#include "soter_key_options.h"

namespace kmtool {

struct key_options {
  std::optional<uint32_t> algorithm;
  std::optional<uint32_t> size;     // bits
  std::optional<uint32_t> min_mac;  // bits
  std::vector<uint32_t> purposes;
  std::vector<uint32_t> digests;
  std::vector<uint32_t> paddings;
  std::vector<uint32_t> modes;
  application_options application;
  std::optional<uint64_t> user_id;
  std::vector<uint32_t> auth_types;
  std::optional<uint32_t> auth_timeout;
  std::vector<std::string> params;  // TAG=VALUE
  soter_key_options soter;          // of generate alone

  void add_to(CLI::App* verb);
};

// describe_key: the description that generate_key and import_key take. What was not given has the
// algorithm's default, unless a TAG=VALUE has the same tag; an imported key's size and exponent
// come from its data. Throws failure for a malformed TAG=VALUE.
enum class key_source { GENERATED, IMPORTED };
keymaster::client::param_set describe_key(const key_options& options, key_source source);

// parse_param: the parameter that "TAG=VALUE" says. Enumerations by name or number; dates as
// "2026-01-31", with "T12:00:00Z", or in milliseconds; booleans as "true"; bytes as text, or as
// "hex:" and digits. Throws failure.
keymaster::client::param_set parse_param(const std::string& text);

}  // namespace kmtool
