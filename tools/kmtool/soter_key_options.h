// The options that make an RSA key a SOTER key.
#pragma once

#include <optional>
#include <string>

#include "keymaster/client/param_set.h"
#include "options.h"

namespace kmtool {

struct soter_key_options {
  bool wanted = false;
  std::optional<uint32_t> uid;
  std::string export_sign = "attk";  // attk, none, or key=FILE with the signing key's blob
  bool counter = false;

  void add_to(CLI::App* verb);
  // tags: what goes into the key's description; nothing unless wanted. Reads the signing key's
  // file. Throws failure for another algorithm than RSA or a malformed option.
  keymaster::client::param_set tags(uint32_t algorithm) const;
};

}  // namespace kmtool
