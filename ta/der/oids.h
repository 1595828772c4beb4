// Object identifiers. Identifiers of one family share their prefix segments.
#pragma once

#include "ta/der/asn1.h"

namespace keymaster {

// PKCS #1 (RFC 8017), 1.2.840.113549.1.1
extern const ASN1_OID OID_RSA_ENCRYPTION;              // .1
extern const ASN1_OID OID_MD5_WITH_RSA_ENCRYPTION;     // .4
extern const ASN1_OID OID_SHA1_WITH_RSA_ENCRYPTION;    // .5
extern const ASN1_OID OID_SHA256_WITH_RSA_ENCRYPTION;  // .11
extern const ASN1_OID OID_SHA384_WITH_RSA_ENCRYPTION;  // .12
extern const ASN1_OID OID_SHA512_WITH_RSA_ENCRYPTION;  // .13
// Elliptic curves (RFC 5480)
extern const ASN1_OID OID_EC_PUBLIC_KEY;  // 1.2.840.10045.2.1
extern const ASN1_OID OID_PRIME_FIELD;    // 1.2.840.10045.1.1
extern const ASN1_OID OID_P_224;          // 1.3.132.0.33
extern const ASN1_OID OID_P_256;          // 1.2.840.10045.3.1.7
extern const ASN1_OID OID_P_384;          // 1.3.132.0.34
extern const ASN1_OID OID_P_521;          // 1.3.132.0.35
// X.520 and RFC 5280
extern const ASN1_OID OID_COMMON_NAME;        // 2.5.4.3
extern const ASN1_OID OID_KEY_USAGE;          // 2.5.29.15
extern const ASN1_OID OID_BASIC_CONSTRAINTS;  // 2.5.29.19
// The key description extension, 1.3.6.1.4.1.11129.2.1.17
extern const ASN1_OID OID_KEY_DESCRIPTION;

}  // namespace keymaster
