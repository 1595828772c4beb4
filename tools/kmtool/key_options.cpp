// Options and defaults of keys.
#include "key_options.h"

#include <algorithm>
#include <utility>

#include "keymaster/client/names.h"
#include "tool.h"

namespace kmtool {

using namespace keymaster;
using client::param_set;

namespace {

struct algorithm_defaults {
  uint32_t algorithm = 0;
  uint32_t size = 0;
  std::optional<uint64_t> exponent = {};
  std::vector<uint32_t> purposes = {};
  std::vector<uint32_t> digests = {};
  std::vector<uint32_t> paddings = {};
  std::vector<uint32_t> modes = {};
  std::optional<uint32_t> min_mac = {};
};

const algorithm_defaults& defaults_of(uint32_t algorithm) {
  static const algorithm_defaults TABLE[] = {
      {.algorithm = KM_ALGORITHM_HMAC,
       .size = 256,
       .purposes = {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY},
       .digests = {KM_DIGEST_SHA_2_256},
       .min_mac = 128},
      {.algorithm = KM_ALGORITHM_AES,
       .size = 256,
       .purposes = {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT},
       .paddings = {KM_PAD_NONE, KM_PAD_PKCS7},
       .modes = {KM_MODE_GCM},
       .min_mac = 128},
      {.algorithm = KM_ALGORITHM_RSA,
       .size = 2048,
       .exponent = 65537,
       .purposes = {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY, KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT},
       .digests = {KM_DIGEST_SHA_2_256},
       .paddings = {KM_PAD_RSA_PSS, KM_PAD_RSA_OAEP}},
      {.algorithm = KM_ALGORITHM_EC,
       .size = 256,
       .purposes = {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY},
       .digests = {KM_DIGEST_SHA_2_256}},
  };
  static const algorithm_defaults NONE = {};
  const auto* row = std::ranges::find(TABLE, algorithm, &algorithm_defaults::algorithm);
  return row == std::end(TABLE) ? NONE : *row;
}

// Builds a description: a value given by an option, else the default unless the tag is there.
class description {
 public:
  explicit description(param_set extra) : extra_(std::move(extra)) {}

  void one(keymaster_tag_t tag, std::optional<uint64_t> given, std::optional<uint64_t> fallback) {
    if (!given && !extra_.contains(tag)) given = fallback;
    if (given) set_.add(tag, *given);
  }

  void list(keymaster_tag_t tag, const std::vector<uint32_t>& given,
            const std::vector<uint32_t>& fallback) {
    bool use_fallback = given.empty() && !extra_.contains(tag);
    for (uint32_t value : use_fallback ? fallback : given)
      set_.add(tag, value);
  }

  void user(const key_options& options) {
    if (options.user_id) {
      uint32_t types = 0;
      for (uint32_t type : options.auth_types)
        types |= type;
      set_.add(KM_TAG_USER_SECURE_ID, *options.user_id).add(KM_TAG_USER_AUTH_TYPE, types);
      one(KM_TAG_AUTH_TIMEOUT, options.auth_timeout, {});
    } else if (!extra_.contains(KM_TAG_USER_SECURE_ID)) {
      one(KM_TAG_NO_AUTH_REQUIRED, {}, 1);
    }
  }

  bool has(keymaster_tag_t tag, uint32_t value) const {
    std::vector<uint64_t> all = param_set(set_).append(extra_).numbers(tag);
    return std::ranges::count(all, value) > 0;
  }

  param_set* set() { return &set_; }
  param_set take() { return std::move(set_.append(extra_)); }

 private:
  param_set set_;
  param_set extra_;
};

failure bad_param(const std::string& text, const std::string& reason) {
  return {WRONG_USAGE, "--param " + text + ": " + reason};
}

failure unknown_tag(const std::string& text, const std::string& name) {
  std::vector<std::string> known;
  for (const keymaster_tag_t tag : client::all_tags())
    known.push_back(client::tag_name(tag));
  const std::string meant = meant_instead(name, known);
  return {WRONG_USAGE, "--param " + text + ": there is no tag '" + name + "'",
          meant.empty() ? "'kmtool help tags' lists them." : meant};
}

client::bytes parse_bytes(const std::string& text, const std::string& value) try {
  if (value.starts_with("hex:")) return client::from_hex(value.substr(4));
  return client::copy_of(client::as_bytes(value));
} catch (const std::invalid_argument& error) {
  throw bad_param(text, error.what());
}

uint64_t parse_tag_number(const std::string& text, keymaster_tag_t tag, const std::string& value) {
  uint32_t kind = tag_class(tag);
  std::optional<uint64_t> number;
  if (kind == KM_ENUM || kind == KM_ENUM_REP) {
    number = client::parse_value(tag, value);
    std::string names = names_of(tag);
    if (!number && !names.empty()) throw bad_param(text, "'" + value + "' is none of: " + names);
  } else if (kind == KM_DATE) {
    number = client::parse_date(value);
  } else if (kind == KM_BOOL) {
    if (value == "true") number = 1;
    if (!number) throw bad_param(text, "a flag is 'true' or left out");
  } else {
    number = client::parse_number(value);
  }
  if (!number) throw bad_param(text, "'" + value + "' is no value of this tag");
  return *number;
}

}  // namespace

void key_options::add_to(CLI::App* verb) {
  add_number(verb, "--size", &size, "Key size in bits");
  add_names(verb, "--purpose", KM_TAG_PURPOSE, &purposes, "What the key may do");
  add_names(verb, "--digest", KM_TAG_DIGEST, &digests, "Digests it may use");
  add_names(verb, "--padding", KM_TAG_PADDING, &paddings, "Paddings it may use");
  add_names(verb, "--mode", KM_TAG_BLOCK_MODE, &modes, "Block modes it may use");
  add_number(verb, "--min-mac", &min_mac, "Shortest MAC or GCM tag, in bits");
  application.add_to(verb);
  auto* user = add_number(verb, "--user-id", &user_id, "Only after this user authenticated");
  auto* types = add_names(verb, "--auth-type", KM_TAG_USER_AUTH_TYPE, &auth_types, "How");
  auto* timeout = add_number(verb, "--auth-timeout", &auth_timeout,
                             "One authentication serves many uses, instead of one each");
  user->needs(types);
  types->needs(user);
  timeout->needs(user);
  verb->add_option("--param", params, "Any parameter by its tag's name or number")
      ->type_name("TAG=VALUE")
      ->take_all();
}

param_set parse_param(const std::string& text) {
  size_t equals = text.find('=');
  if (equals == std::string::npos) throw bad_param(text, "has the form TAG=VALUE");
  std::optional<keymaster_tag_t> tag = client::parse_tag(text.substr(0, equals));
  if (!tag) throw unknown_tag(text, text.substr(0, equals));
  std::string value = text.substr(equals + 1);
  param_set set;
  try {
    if (has_blob(*tag)) return set.add_bytes(*tag, parse_bytes(text, value));
    return set.add(*tag, parse_tag_number(text, *tag, value));
  } catch (const std::invalid_argument& error) {
    throw bad_param(text, error.what());
  }
}

param_set describe_key(const key_options& options, key_source source) {
  param_set extra;
  for (const std::string& text : options.params)
    extra.append(parse_param(text));
  uint32_t algorithm = options.algorithm.value_or(0);
  algorithm_defaults defaults = defaults_of(algorithm);
  std::optional<uint64_t> default_size = defaults.size;
  if (source == key_source::IMPORTED) {
    default_size.reset();
    defaults.exponent.reset();
  }
  if (options.soter.wanted) {
    defaults.purposes = {KM_PURPOSE_SIGN};
    defaults.paddings = {KM_PAD_RSA_PSS};
  }
  description key(std::move(extra));
  key.one(KM_TAG_ALGORITHM, algorithm, {});
  key.one(KM_TAG_KEY_SIZE, options.size, default_size);
  key.one(KM_TAG_RSA_PUBLIC_EXPONENT, {}, defaults.exponent);
  key.list(KM_TAG_PURPOSE, options.purposes, defaults.purposes);
  key.list(KM_TAG_DIGEST, options.digests, defaults.digests);
  key.list(KM_TAG_PADDING, options.paddings, defaults.paddings);
  key.list(KM_TAG_BLOCK_MODE, options.modes, defaults.modes);
  // AES keys have MACs in GCM alone.
  bool has_mac = algorithm != KM_ALGORITHM_AES || key.has(KM_TAG_BLOCK_MODE, KM_MODE_GCM);
  if (!has_mac) defaults.min_mac.reset();
  key.one(KM_TAG_MIN_MAC_LENGTH, options.min_mac, defaults.min_mac);
  options.application.get().bind(key.set());
  key.user(options);
  key.set()->append(options.soter.tags(algorithm));
  return key.take();
}

}  // namespace kmtool
