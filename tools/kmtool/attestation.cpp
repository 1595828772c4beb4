// Reading of attestation certificates. libcrypto takes DER apart; what a field means is decided
// here.
#include "attestation.h"

#include <openssl/asn1.h>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/pem.h>

#include "keymaster/client/bytes.h"

namespace kmtool {

using namespace keymaster;

namespace {

constexpr char KEY_DESCRIPTION_OID[] = "1.3.6.1.4.1.11129.2.1.17";
constexpr uint32_t ROOT_OF_TRUST = 704;

struct bio_deleter {
  void operator()(BIO* bio) const { BIO_free(bio); }
};

struct element {
  int tag;
  int tag_class;  // V_ASN1_UNIVERSAL, V_ASN1_CONTEXT_SPECIFIC, ...
  byte_view content;
};

// Elements one behind the other.
class der_reader {
 public:
  explicit der_reader(byte_view der) : rest_(der) {}

  bool done() const { return rest_.empty(); }

  element next(const char* what) {
    const unsigned char* at = rest_.data();
    long length = 0;
    element found{};
    const int flags = ASN1_get_object(&at, &length, &found.tag, &found.tag_class,
                                      static_cast<long>(rest_.size()));
    // 0x80: malformed or longer than what is left; 1: indefinite length, which DER does not have.
    if (rest_.empty() || (flags & 0x80) != 0 || (flags & 1) != 0) {
      ERR_clear_error();
      throw attestation_error(std::string("cannot read ") + what + ": not DER");
    }
    const size_t header = static_cast<size_t>(at - rest_.data());
    found.content = rest_.subspan(header, static_cast<size_t>(length));
    rest_ = rest_.subspan(header + static_cast<size_t>(length));
    return found;
  }

  byte_view next(const char* what, int tag) {
    const element found = next(what);
    if (found.tag_class != V_ASN1_UNIVERSAL || found.tag != tag) {
      throw attestation_error(std::string("unexpected type of ") + what);
    }
    return found.content;
  }

  // An INTEGER or ENUMERATED of at most 64 bits, not negative.
  uint64_t next_number(const char* what) {
    const element found = next(what);
    if (found.tag_class != V_ASN1_UNIVERSAL ||
        (found.tag != V_ASN1_INTEGER && found.tag != V_ASN1_ENUMERATED)) {
      throw attestation_error(std::string("unexpected type of ") + what);
    }
    return number(found.content, what);
  }

 private:
  static uint64_t number(byte_view content, const char* what) {
    const bool fits = !content.empty() && (content[0] & 0x80) == 0 &&
                      (content.size() <= 8 || (content.size() == 9 && content[0] == 0));
    if (!fits) throw attestation_error(std::string("number out of range: ") + what);
    uint64_t value = 0;
    for (const uint8_t octet : content)
      value = value << 8 | octet;
    return value;
  }

  byte_view rest_;
};

root_of_trust parse_root(byte_view wrapped) {
  der_reader fields(der_reader(wrapped).next("root of trust", V_ASN1_SEQUENCE));
  root_of_trust root;
  root.verified_boot_key = client::copy_of(fields.next("verified boot key", V_ASN1_OCTET_STRING));
  const byte_view locked = fields.next("device locked", V_ASN1_BOOLEAN);
  root.device_locked = locked.size() == 1 && locked[0] != 0;
  root.verified_boot_state = fields.next_number("verified boot state");
  return root;
}

// The Keymaster tag with this number; nothing when there is none.
std::optional<keymaster_tag_t> tag_of(uint32_t number) {
  static constexpr keymaster_tag_t TAGS[] = {
#define KM_TAG_VALUE(name, value) value,
      KM_TAG_LIST(KM_TAG_VALUE)
#undef KM_TAG_VALUE
  };
  for (const keymaster_tag_t tag : TAGS) {
    if ((tag & ~KM_TAG_CLASS_MASK) == number && tag != KM_TAG_INVALID) return tag;
  }
  return std::nullopt;
}

void add_param(keymaster_tag_t tag, uint64_t number, const std::string& name,
               client::param_set* params) try {
  params->add(tag, number);
} catch (const std::invalid_argument&) {
  throw attestation_error("number out of range: " + name);
}

void add_field(keymaster_tag_t tag, byte_view wrapped, client::param_set* params) {
  const std::string name = "authorisation " + std::to_string(tag & ~KM_TAG_CLASS_MASK);
  der_reader value(wrapped);
  switch (tag_class(tag)) {
    case KM_ENUM_REP:
    case KM_UINT_REP:
    case KM_ULONG_REP: {
      der_reader elements(value.next(name.c_str(), V_ASN1_SET));
      while (!elements.done())
        add_param(tag, elements.next_number(name.c_str()), name, params);
      return;
    }
    case KM_BOOL:
      value.next(name.c_str(), V_ASN1_NULL);
      params->add_flag(tag);
      return;
    case KM_BYTES:
    case KM_BIGNUM:
      params->add_bytes(tag, value.next(name.c_str(), V_ASN1_OCTET_STRING));
      return;
    default:
      add_param(tag, value.next_number(name.c_str()), name, params);
  }
}

authorization_list parse_list(byte_view content) {
  authorization_list list;
  der_reader fields(content);
  while (!fields.done()) {
    const element field = fields.next("authorisation");
    if (field.tag_class != V_ASN1_CONTEXT_SPECIFIC) {
      throw attestation_error("unexpected type of authorisation");
    }
    const uint32_t number = static_cast<uint32_t>(field.tag);
    const std::optional<keymaster_tag_t> tag = tag_of(number);
    if (number == ROOT_OF_TRUST) {
      list.root = parse_root(field.content);
    } else if (tag) {
      add_field(*tag, field.content, &list.params);
    } else {
      list.unknown.push_back(number);
    }
  }
  return list;
}

certificate parse_der(byte_view der, const char* what) {
  const unsigned char* at = der.data();
  certificate parsed(d2i_X509(nullptr, &at, static_cast<long>(der.size())));
  ERR_clear_error();
  if (!parsed || at != der.data() + der.size()) {
    throw attestation_error(std::string(what) + " is not a certificate");
  }
  return parsed;
}

std::unique_ptr<BIO, bio_deleter> memory(byte_view from) {
  std::unique_ptr<BIO, bio_deleter> bio(
      BIO_new_mem_buf(from.data(), static_cast<int>(from.size())));
  if (!bio) throw std::bad_alloc();
  return bio;
}

}  // namespace

key_description parse_key_description(byte_view der) {
  der_reader outer(der);
  der_reader fields(outer.next("key description", V_ASN1_SEQUENCE));
  key_description found;
  found.attestation_version = fields.next_number("attestation version");
  found.attestation_security_level = fields.next_number("attestation security level");
  found.keymaster_version = fields.next_number("keymaster version");
  found.keymaster_security_level = fields.next_number("keymaster security level");
  found.challenge = client::copy_of(fields.next("attestation challenge", V_ASN1_OCTET_STRING));
  found.unique_id = client::copy_of(fields.next("unique id", V_ASN1_OCTET_STRING));
  found.software_enforced = parse_list(fields.next("software enforced", V_ASN1_SEQUENCE));
  found.tee_enforced = parse_list(fields.next("TEE enforced", V_ASN1_SEQUENCE));
  return found;
}

std::optional<key_description> find_key_description(const X509* from) {
  const std::unique_ptr<ASN1_OBJECT, decltype(&ASN1_OBJECT_free)> id(
      OBJ_txt2obj(KEY_DESCRIPTION_OID, 1), ASN1_OBJECT_free);
  const int index = X509_get_ext_by_OBJ(from, id.get(), -1);
  if (index < 0) return std::nullopt;
  const ASN1_OCTET_STRING* value = X509_EXTENSION_get_data(X509_get_ext(from, index));
  return parse_key_description(
      {ASN1_STRING_get0_data(value), static_cast<size_t>(ASN1_STRING_length(value))});
}

std::vector<certificate> parse_certificates(byte_view file) {
  std::vector<certificate> found;
  const std::unique_ptr<BIO, bio_deleter> bio = memory(file);
  while (X509* next = PEM_read_bio_X509(bio.get(), nullptr, nullptr, nullptr)) {
    found.emplace_back(next);
  }
  const unsigned long reason = ERR_peek_last_error();
  ERR_clear_error();
  if (found.empty()) {
    found.push_back(parse_der(file, "the file"));
  } else if (ERR_GET_REASON(reason) != PEM_R_NO_START_LINE) {
    throw attestation_error("certificate " + std::to_string(found.size() + 1) +
                            " of the file is damaged");
  }
  return found;
}

std::vector<certificate> chain_of(byte_view output) {
  std::vector<certificate> chain;
  client::field_reader fields(output);
  while (fields.left() != 0)
    chain.push_back(parse_der(fields.field(), "a link of the chain"));
  return chain;
}

std::string to_pem(const X509* from) {
  const std::unique_ptr<BIO, bio_deleter> bio(BIO_new(BIO_s_mem()));
  if (!bio || PEM_write_bio_X509(bio.get(), from) != 1) throw std::bad_alloc();
  char* text = nullptr;
  const long length = BIO_get_mem_data(bio.get(), &text);
  return std::string(text, static_cast<size_t>(length));
}

}  // namespace kmtool
