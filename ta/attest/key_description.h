// The key description extension of an attestation certificate: the key's authorisations, the
// caller's challenge and the root of trust, as a SEQUENCE under 1.3.6.1.4.1.11129.2.1.17.
#pragma once

#include "ta/der/x509.h"
#include "ta/params/param_set.h"

namespace keymaster {

// SET_OF_INTEGER: elements come out in the order in which they were added, duplicates included.
// Intended: relying parties compare them with the key's parameters.
struct SET_OF_INTEGER {
  asn1_list items;
};

struct RootOfTrust {
  ASN1_OCTET_STRING verified_boot_key;
  uint8_t device_locked;
  uint64_t verified_boot_state;
};

// AuthorizationList: every field is optional. A boolean authorisation has no value beside its
// presence byte.
struct AuthorizationList {
  SET_OF_INTEGER purpose;
  uint64_t algorithm;
  uint64_t key_size;
  SET_OF_INTEGER digest;
  SET_OF_INTEGER padding;
  SET_OF_INTEGER kdf;
  uint64_t ec_curve;
  uint64_t rsa_public_exponent;
  uint64_t active_date_time;
  uint64_t origination_expire_date_time;
  uint64_t usage_expire_date_time;
  uint64_t user_auth_type;
  uint64_t auth_timeout;
  ASN1_OCTET_STRING application_id;
  uint64_t creation_date_time;
  uint64_t origin;
  RootOfTrust root_of_trust;
  uint64_t os_version;
  uint64_t os_patch_level;
  uint8_t has_purpose, has_algorithm, has_key_size, has_digest, has_padding, has_kdf, has_ec_curve,
      has_rsa_public_exponent, has_active_date_time, has_origination_expire_date_time,
      has_usage_expire_date_time, has_no_auth_required, has_user_auth_type, has_auth_timeout,
      has_allow_while_on_body, has_all_applications, has_application_id, has_creation_date_time,
      has_origin, has_rollback_resistant, has_root_of_trust, has_os_version, has_os_patch_level;
};

struct KeyDescription {
  uint64_t attestation_version;
  uint64_t attestation_security_level;
  uint64_t keymaster_version;
  uint64_t keymaster_security_level;
  ASN1_OCTET_STRING attestation_challenge;
  ASN1_OCTET_STRING unique_id;
  AuthorizationList software_enforced;
  AuthorizationList tee_enforced;
  uint8_t has_attestation_version, has_attestation_security_level, has_keymaster_version,
      has_keymaster_security_level;
};

KM_DECLARE_ASN1_RECORD(SET_OF_INTEGER)
KM_DECLARE_ASN1_RECORD(RootOfTrust)
KM_DECLARE_ASN1_RECORD(AuthorizationList)
KM_DECLARE_ASN1_RECORD(KeyDescription)

// A new element, linked in; null when out of memory.
[[nodiscard]] uint64_t* SET_OF_INTEGER_alloc_item(SET_OF_INTEGER* set);

// fill_auth_list_by_param_set: walks the set in order and fills the list. A scalar tag that occurs
// again keeps its last value. Tags without a field are passed over; unknown ones are traced. -41:
// out of memory; what was added stays in the list.
[[nodiscard]] keymaster_error_t fill_auth_list_by_param_set(const keymaster_key_param_set_t& set,
                                                            AuthorizationList* list);

// generate_unique_id: intended to fail: this system has no unique identifiers. Always
// KM_ERROR_UNIMPLEMENTED; nothing is written.
[[nodiscard]] keymaster_error_t generate_unique_id(ASN1_OCTET_STRING* destination,
                                                   uint64_t creation_date_time,
                                                   byte_view application_id,
                                                   bool reset_since_rotation);

// character_to_extension: fills `extension` with the description of a key whose characteristics are
// `hardware` and `software` enforced. -21: the challenge in `attest_params` is longer than 128
// bytes. -33, -100: the key asks for a unique identifier. -41: out of memory. -1000: the writer
// failed.
[[nodiscard]] keymaster_error_t character_to_extension(
    const keymaster_key_param_set_t& hardware, const keymaster_key_param_set_t& software,
    const keymaster_key_param_set_t& attest_params, X509_EXTENSION* extension);

}  // namespace keymaster
