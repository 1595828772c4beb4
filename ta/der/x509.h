// The X.509 records (RFC 5280), with the public keys of RSA (RFC 8017) and EC (RFC 5480, SEC 1).
// A record is made by X_alloc and given back with X_free; X_write encodes it to the start of a
// buffer and returns the length or a negative code. `has_` bytes tell which optional fields are
// present.
#pragma once

#include "ta/der/asn1.h"

namespace keymaster {

struct EC_FIELD {  // FieldID of a prime field
  const ASN1_OID* type;
  ASN1_OCTET_STRING prime;
};

struct EC_CURVE {
  ASN1_OCTET_STRING a;
  ASN1_OCTET_STRING b;
  ASN1_BIT_STRING seed;
  uint8_t has_seed;
};

struct EC_PARAM {  // explicit domain parameters
  uint64_t version;
  EC_FIELD field;
  EC_CURVE curve;
  ASN1_OCTET_STRING base;
  ASN1_OCTET_STRING order;
  uint64_t cofactor;
  uint8_t has_cofactor;
};

// ECPK_PARAM: how an EC key names its curve.
enum : uint32_t { ECPK_NAMED_CURVE = 1, ECPK_EXPLICIT = 2 };
struct ECPK_PARAM {
  uint32_t selector;
  const ASN1_OID* named_curve;
  EC_PARAM explicit_parameters;
};

// X509_ALGOR_PARAM: the parameters of an algorithm identifier.
enum : uint32_t { ALGOR_NULL = 1, ALGOR_EC = 2 };
struct X509_ALGOR_PARAM {
  uint32_t selector;
  ECPK_PARAM ec;
};

struct X509_ALGOR {
  const ASN1_OID* algorithm;
  X509_ALGOR_PARAM parameters;
  uint8_t has_parameters;
};

struct RSA_PUBKEY {
  ASN1_OCTET_STRING n;
  ASN1_OCTET_STRING e;
};

struct X509_PUBKEY {
  X509_ALGOR algorithm;
  ASN1_BIT_STRING key;
};

struct X509_ATTR {
  const ASN1_OID* type;
  ASN1_OCTET_STRING value;  // written as UTF8String
};

// X509_NAME: one relative distinguished name an entry.
struct X509_NAME {
  asn1_list entries;
};

using X509_TIME = ASN1_TIME;

struct X509_VALIDITY {
  X509_TIME not_before;
  X509_TIME not_after;
};

struct X509_EXTENSION {
  const ASN1_OID* id;
  uint8_t critical;
  uint8_t has_critical;  // absent stands for FALSE, which DER does not encode
  ASN1_OCTET_STRING value;
};

struct X509_EXTENSIONS {
  asn1_list items;
};

struct X509_BASIC_CONSTRAINTS {
  uint8_t ca;
  uint8_t has_ca;
  uint64_t path_length;
  uint8_t has_path_length;
};

struct X509_CINF {  // TBSCertificate
  uint64_t version;
  uint8_t has_version;
  uint64_t serial;
  X509_ALGOR signature;
  X509_NAME issuer;
  X509_VALIDITY validity;
  X509_NAME subject;
  X509_PUBKEY key;
  X509_EXTENSIONS extensions;
  uint8_t has_extensions;
};

struct X509_CERT {
  const X509_CINF* cinf;  // borrowed
  X509_ALGOR algorithm;
  ASN1_BIT_STRING signature;
};

inline constexpr const asn1_type& X509_TIME_TYPE = ASN1_TIME_TYPE;
KM_DECLARE_ASN1_OPERATIONS(X509_TIME)
KM_DECLARE_ASN1_RECORD(EC_FIELD)
KM_DECLARE_ASN1_RECORD(EC_CURVE)
KM_DECLARE_ASN1_RECORD(EC_PARAM)
KM_DECLARE_ASN1_RECORD(ECPK_PARAM)
KM_DECLARE_ASN1_RECORD(X509_ALGOR)
KM_DECLARE_ASN1_RECORD(RSA_PUBKEY)
KM_DECLARE_ASN1_RECORD(X509_PUBKEY)
KM_DECLARE_ASN1_RECORD(X509_ATTR)
KM_DECLARE_ASN1_RECORD(X509_NAME)
KM_DECLARE_ASN1_RECORD(X509_VALIDITY)
KM_DECLARE_ASN1_RECORD(X509_EXTENSION)
KM_DECLARE_ASN1_RECORD(X509_EXTENSIONS)
KM_DECLARE_ASN1_RECORD(X509_BASIC_CONSTRAINTS)
KM_DECLARE_ASN1_RECORD(X509_CINF)
KM_DECLARE_ASN1_RECORD(X509_CERT)

// Adds a relative distinguished name of one attribute; the value's length is taken as given, a
// terminating zero included. 0 or DER_NO_MEMORY.
[[nodiscard]] int32_t X509_NAME_add(X509_NAME* name, const ASN1_OID* attribute, byte_view value);

// A new entry, empty and linked in; the list owns it. Null when out of memory.
[[nodiscard]] X509_ATTR* X509_NAME_alloc_item(X509_NAME* name);
[[nodiscard]] X509_EXTENSION* X509_EXTENSIONS_alloc_item(X509_EXTENSIONS* extensions);

// The identifiers of RSA carry an explicit NULL (RFC 4055), those of EC keys their named curve.
void X509_ALGOR_set_rsa(X509_ALGOR* algorithm, const ASN1_OID* id);
void X509_ALGOR_set_ec(X509_ALGOR* algorithm, const ASN1_OID* curve);

}  // namespace keymaster
