// Attestation certificates as others read them: the chain, and the key description in each
// certificate's extension 1.3.6.1.4.1.11129.2.1.17. Input may come from anywhere.
#pragma once

#include <memory>
#include <openssl/x509.h>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "keymaster/client/param_set.h"

namespace kmtool {

using keymaster::client::byte_view;
using keymaster::client::bytes;

// What is not a certificate or not a key description; the text says where it goes wrong.
class attestation_error : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct root_of_trust {
  bytes verified_boot_key;
  bool device_locked = false;
  uint64_t verified_boot_state = 0;
};

struct authorization_list {
  keymaster::client::param_set params;  // fields by the Keymaster tag of their number
  std::vector<uint32_t> unknown;        // numbers of fields that have no tag
  std::optional<root_of_trust> root;
};

struct key_description {
  uint64_t attestation_version = 0;
  uint64_t attestation_security_level = 0;
  uint64_t keymaster_version = 0;
  uint64_t keymaster_security_level = 0;
  bytes challenge;
  bytes unique_id;
  authorization_list software_enforced;
  authorization_list tee_enforced;
};

struct x509_deleter {
  void operator()(X509* certificate) const { X509_free(certificate); }
};
using certificate = std::unique_ptr<X509, x509_deleter>;

// parse_key_description: reads the DER of a KeyDescription. Integers and enumerations are taken
// alike; fields that later versions put behind the known ones are passed over. attestation_error.
key_description parse_key_description(byte_view der);

// find_key_description: that of a certificate; nothing when it has no such extension.
std::optional<key_description> find_key_description(const X509* from);

// parse_certificates: certificates in PEM, one behind the other, or a single one in DER.
std::vector<certificate> parse_certificates(byte_view file);

// chain_of: the certificates of attest_key's output: each a u32 little-endian length and DER.
std::vector<certificate> chain_of(byte_view output);

std::string to_pem(const X509* from);

}  // namespace kmtool
