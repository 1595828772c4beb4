// Documents that SOTER keys sign: written to files, verified, shown.
#pragma once

#include <optional>
#include <string>

#include "keymaster/client/soter.h"
#include "tool.h"

namespace kmtool {

using keymaster::client::byte_view;
using keymaster::client::bytes;

// Where a document and its signature go. Without `document` both are printed; without `signature`
// it goes beside the document, with ".sig" behind the name.
struct document_files {
  std::string document;
  std::string signature;

  // The options -o and --signature.
  void add_to(CLI::App* verb, const std::string& document_help);
  // Throws failure when the options do not go together, or the signature would go over `key`.
  void check(const std::string& key) const;
};

// deliver: writes the parts of `made` to their files, or into the result: members "document" (the
// text) and "signature" (hexadecimal).
verb_result deliver(const keymaster::client::signed_document& made, const document_files& files);

// verifying_padding: which RSA padding the signature over `data` verifies with, "pkcs1" or "pss"
// (RFC 8017; any salt length); nothing when it verifies with neither. `digest` is a KM_DIGEST_...
// value; `key` the content of `path`, an RSA public key in PEM or DER. Throws failure (WRONG_USAGE)
// when it is none.
std::optional<std::string> verifying_padding(byte_view data, byte_view signature, uint32_t digest,
                                             const std::string& path, byte_view key);

// escape_controls: the text with control characters, which documents hold as they are, written as
// \u00XX.
std::string escape_controls(std::string_view text);

}  // namespace kmtool
