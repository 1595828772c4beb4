// Object identifiers.
#include "ta/der/oids.h"

namespace keymaster {
namespace {

// A segment's arcs, as an object with an address of its own.
template <uint64_t... ARCS>
struct arcs {
  static constexpr uint64_t VALUES[] = {ARCS...};
};

template <uint64_t... ARCS>
constexpr ASN1_OID segment(const ASN1_OID* parent = nullptr) {
  return {parent, arcs<ARCS...>::VALUES, sizeof...(ARCS)};
}

constexpr ASN1_OID PKCS_1 = segment<1, 2, 840, 113549, 1, 1>();
constexpr ASN1_OID X9_62 = segment<1, 2, 840, 10045>();
constexpr ASN1_OID CERTICOM_CURVES = segment<1, 3, 132, 0>();
constexpr ASN1_OID ATTRIBUTES = segment<2, 5, 4>();
constexpr ASN1_OID EXTENSIONS = segment<2, 5, 29>();
constexpr ASN1_OID ISO = segment<1>();
constexpr ASN1_OID ORGANISATION = segment<3>(&ISO);
constexpr ASN1_OID DOD = segment<6>(&ORGANISATION);
constexpr ASN1_OID INTERNET = segment<1>(&DOD);
constexpr ASN1_OID PRIVATE = segment<4>(&INTERNET);
constexpr ASN1_OID ENTERPRISE = segment<1>(&PRIVATE);
constexpr ASN1_OID ATTESTATION_ENTERPRISE = segment<11129>(&ENTERPRISE);

}  // namespace

const ASN1_OID OID_RSA_ENCRYPTION = segment<1>(&PKCS_1);
const ASN1_OID OID_MD5_WITH_RSA_ENCRYPTION = segment<4>(&PKCS_1);
const ASN1_OID OID_SHA1_WITH_RSA_ENCRYPTION = segment<5>(&PKCS_1);
const ASN1_OID OID_SHA256_WITH_RSA_ENCRYPTION = segment<11>(&PKCS_1);
const ASN1_OID OID_SHA384_WITH_RSA_ENCRYPTION = segment<12>(&PKCS_1);
const ASN1_OID OID_SHA512_WITH_RSA_ENCRYPTION = segment<13>(&PKCS_1);
const ASN1_OID OID_EC_PUBLIC_KEY = segment<2, 1>(&X9_62);
const ASN1_OID OID_PRIME_FIELD = segment<1, 1>(&X9_62);
const ASN1_OID OID_P_224 = segment<33>(&CERTICOM_CURVES);
const ASN1_OID OID_P_256 = segment<3, 1, 7>(&X9_62);
const ASN1_OID OID_P_384 = segment<34>(&CERTICOM_CURVES);
const ASN1_OID OID_P_521 = segment<35>(&CERTICOM_CURVES);
const ASN1_OID OID_COMMON_NAME = segment<3>(&ATTRIBUTES);
const ASN1_OID OID_KEY_USAGE = segment<15>(&EXTENSIONS);
const ASN1_OID OID_BASIC_CONSTRAINTS = segment<19>(&EXTENSIONS);
const ASN1_OID OID_KEY_DESCRIPTION = segment<2, 1, 17>(&ATTESTATION_ENTERPRISE);

}  // namespace keymaster
