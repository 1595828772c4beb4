// The X.509 records: their templates.
#include "ta/der/x509.h"

#include "ta/base/trace.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

// A field that is always written, and one that its presence byte decides on.
#define FIELD(record, member, type) \
  { offsetof(record, member), ASN1_NO_TAG, &(type), ASN1_ALWAYS }
#define OPTIONAL_FIELD(record, member, tag, type) \
  { offsetof(record, member), tag, &(type), offsetof(record, has_##member) }

constexpr asn1_field EC_FIELD_FIELDS[] = {
    FIELD(EC_FIELD, type, ASN1_OID_TYPE),
    FIELD(EC_FIELD, prime, ASN1_BIG_INTEGER_TYPE),
};

constexpr asn1_field EC_CURVE_FIELDS[] = {
    FIELD(EC_CURVE, a, ASN1_OCTET_STRING_TYPE),
    FIELD(EC_CURVE, b, ASN1_OCTET_STRING_TYPE),
    OPTIONAL_FIELD(EC_CURVE, seed, ASN1_NO_TAG, ASN1_BIT_STRING_TYPE),
};

constexpr asn1_field EC_PARAM_FIELDS[] = {
    FIELD(EC_PARAM, version, ASN1_INTEGER_TYPE),
    FIELD(EC_PARAM, field, EC_FIELD_TYPE),
    FIELD(EC_PARAM, curve, EC_CURVE_TYPE),
    FIELD(EC_PARAM, base, ASN1_OCTET_STRING_TYPE),
    FIELD(EC_PARAM, order, ASN1_BIG_INTEGER_TYPE),
    OPTIONAL_FIELD(EC_PARAM, cofactor, ASN1_NO_TAG, ASN1_INTEGER_TYPE),
};

constexpr asn1_alternative ECPK_PARAM_TABLE[] = {
    {ECPK_NAMED_CURVE, offsetof(ECPK_PARAM, named_curve), &ASN1_OID_TYPE},
    {ECPK_EXPLICIT, offsetof(ECPK_PARAM, explicit_parameters), &EC_PARAM_TYPE},
};

constexpr asn1_alternative ALGOR_PARAM_TABLE[] = {
    {ALGOR_NULL, 0, &ASN1_NULL_TYPE},
    {ALGOR_EC, offsetof(X509_ALGOR_PARAM, ec), &ECPK_PARAM_TYPE},
};
constexpr asn1_type ALGOR_PARAM_TYPE = asn1_choice<ALGOR_PARAM_TABLE>::TYPE;

constexpr asn1_field X509_ALGOR_FIELDS[] = {
    FIELD(X509_ALGOR, algorithm, ASN1_OID_TYPE),
    OPTIONAL_FIELD(X509_ALGOR, parameters, ASN1_NO_TAG, ALGOR_PARAM_TYPE),
};

constexpr asn1_field RSA_PUBKEY_FIELDS[] = {
    FIELD(RSA_PUBKEY, n, ASN1_BIG_INTEGER_TYPE),
    FIELD(RSA_PUBKEY, e, ASN1_BIG_INTEGER_TYPE),
};

constexpr asn1_field X509_PUBKEY_FIELDS[] = {
    FIELD(X509_PUBKEY, algorithm, X509_ALGOR_TYPE),
    FIELD(X509_PUBKEY, key, ASN1_BIT_STRING_TYPE),
};

constexpr asn1_field X509_ATTR_FIELDS[] = {
    FIELD(X509_ATTR, type, ASN1_OID_TYPE),
    FIELD(X509_ATTR, value, ASN1_UTF8STRING_TYPE),
};

// An entry of a name is a SET of one attribute.
int32_t write_relative_name(der_cursor* out, const void* attribute) {
  return der_wrap(out, DER_SET, X509_ATTR_TYPE.write(out, attribute));
}
constexpr asn1_type RELATIVE_NAME_TYPE = {asn1_sequence<X509_ATTR_FIELDS>::initialise,
                                          asn1_sequence<X509_ATTR_FIELDS>::free,
                                          write_relative_name};

struct name_item {
  asn1_link link;
  X509_ATTR attribute;
};
constexpr asn1_list_of NAME_LIST = {sizeof(name_item), offsetof(name_item, attribute),
                                    &RELATIVE_NAME_TYPE, DER_SEQUENCE};

constexpr asn1_field X509_VALIDITY_FIELDS[] = {
    FIELD(X509_VALIDITY, not_before, X509_TIME_TYPE),
    FIELD(X509_VALIDITY, not_after, X509_TIME_TYPE),
};

constexpr asn1_field X509_EXTENSION_FIELDS[] = {
    FIELD(X509_EXTENSION, id, ASN1_OID_TYPE),
    OPTIONAL_FIELD(X509_EXTENSION, critical, ASN1_NO_TAG, ASN1_BOOLEAN_TYPE),
    FIELD(X509_EXTENSION, value, ASN1_OCTET_STRING_TYPE),
};

struct extension_item {
  asn1_link link;
  X509_EXTENSION extension;
};
constexpr asn1_list_of EXTENSION_LIST = {sizeof(extension_item),
                                         offsetof(extension_item, extension), &X509_EXTENSION_TYPE,
                                         DER_SEQUENCE};

constexpr asn1_field X509_BASIC_CONSTRAINTS_FIELDS[] = {
    OPTIONAL_FIELD(X509_BASIC_CONSTRAINTS, ca, ASN1_NO_TAG, ASN1_BOOLEAN_TYPE),
    OPTIONAL_FIELD(X509_BASIC_CONSTRAINTS, path_length, ASN1_NO_TAG, ASN1_INTEGER_TYPE),
};

constexpr asn1_field X509_CINF_FIELDS[] = {
    OPTIONAL_FIELD(X509_CINF, version, ASN1_EXPLICIT | DER_CONTEXT | 0, ASN1_INTEGER_TYPE),
    FIELD(X509_CINF, serial, ASN1_INTEGER_TYPE),
    FIELD(X509_CINF, signature, X509_ALGOR_TYPE),
    FIELD(X509_CINF, issuer, X509_NAME_TYPE),
    FIELD(X509_CINF, validity, X509_VALIDITY_TYPE),
    FIELD(X509_CINF, subject, X509_NAME_TYPE),
    FIELD(X509_CINF, key, X509_PUBKEY_TYPE),
    OPTIONAL_FIELD(X509_CINF, extensions, ASN1_EXPLICIT | DER_CONTEXT | 3, X509_EXTENSIONS_TYPE),
};

// The to-be-signed part of a certificate is borrowed.
void initialise_borrowed(void* value) {
  *static_cast<const X509_CINF**>(value) = nullptr;
}
int32_t write_borrowed(der_cursor* out, const void* value) {
  const X509_CINF* cinf = *static_cast<const X509_CINF* const*>(value);
  return cinf == nullptr ? DER_INVALID : X509_CINF_TYPE.write(out, cinf);
}
constexpr asn1_type BORROWED_CINF_TYPE = {initialise_borrowed, initialise_borrowed, write_borrowed};

constexpr asn1_field X509_CERT_FIELDS[] = {
    FIELD(X509_CERT, cinf, BORROWED_CINF_TYPE),
    FIELD(X509_CERT, algorithm, X509_ALGOR_TYPE),
    FIELD(X509_CERT, signature, ASN1_BIT_STRING_TYPE),
};

}  // namespace

KM_DEFINE_ASN1_OPERATIONS(X509_TIME)
KM_DEFINE_ASN1_RECORD(EC_FIELD, asn1_sequence<EC_FIELD_FIELDS>)
KM_DEFINE_ASN1_RECORD(EC_CURVE, asn1_sequence<EC_CURVE_FIELDS>)
KM_DEFINE_ASN1_RECORD(EC_PARAM, asn1_sequence<EC_PARAM_FIELDS>)
KM_DEFINE_ASN1_RECORD(ECPK_PARAM, asn1_choice<ECPK_PARAM_TABLE>)
KM_DEFINE_ASN1_RECORD(X509_ALGOR, asn1_sequence<X509_ALGOR_FIELDS>)
KM_DEFINE_ASN1_RECORD(RSA_PUBKEY, asn1_sequence<RSA_PUBKEY_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_PUBKEY, asn1_sequence<X509_PUBKEY_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_ATTR, asn1_sequence<X509_ATTR_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_NAME, asn1_list_type<NAME_LIST>)
KM_DEFINE_ASN1_RECORD(X509_VALIDITY, asn1_sequence<X509_VALIDITY_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_EXTENSION, asn1_sequence<X509_EXTENSION_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_EXTENSIONS, asn1_list_type<EXTENSION_LIST>)
KM_DEFINE_ASN1_RECORD(X509_BASIC_CONSTRAINTS, asn1_sequence<X509_BASIC_CONSTRAINTS_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_CINF, asn1_sequence<X509_CINF_FIELDS>)
KM_DEFINE_ASN1_RECORD(X509_CERT, asn1_sequence<X509_CERT_FIELDS>)

X509_ATTR* X509_NAME_alloc_item(X509_NAME* name) {
  const trace_scope scope;
  auto* item = static_cast<name_item*>(asn1_list_add(NAME_LIST, &name->entries));
  return item == nullptr ? nullptr : &item->attribute;
}

X509_EXTENSION* X509_EXTENSIONS_alloc_item(X509_EXTENSIONS* extensions) {
  const trace_scope scope;
  auto* item = static_cast<extension_item*>(asn1_list_add(EXTENSION_LIST, &extensions->items));
  return item == nullptr ? nullptr : &item->extension;
}

int32_t X509_NAME_add(X509_NAME* name, const ASN1_OID* attribute, byte_view value) {
  X509_ATTR* entry = X509_NAME_alloc_item(name);
  if (entry == nullptr) return DER_NO_MEMORY;
  entry->type = attribute;
  return ASN1_OCTET_STRING_set(&entry->value, value);
}

void X509_ALGOR_set_rsa(X509_ALGOR* algorithm, const ASN1_OID* id) {
  algorithm->algorithm = id;
  algorithm->parameters.selector = ALGOR_NULL;
  algorithm->has_parameters = 1;
}

void X509_ALGOR_set_ec(X509_ALGOR* algorithm, const ASN1_OID* curve) {
  algorithm->algorithm = &OID_EC_PUBLIC_KEY;
  algorithm->parameters.selector = ALGOR_EC;
  algorithm->parameters.ec.selector = ECPK_NAMED_CURVE;
  algorithm->parameters.ec.named_curve = curve;
  algorithm->has_parameters = 1;
}

}  // namespace keymaster
