// The key description extension: templates, and how they are filled.
#include "ta/attest/key_description.h"

#include <algorithm>

#include "product/values.h"
#include "ta/base/outcome.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

constexpr size_t FIRST_BUFFER_SIZE = 1024;
constexpr size_t MAX_CHALLENGE_SIZE = 128;

struct integer_item {
  asn1_link link;
  uint64_t value;
};
constexpr asn1_list_of INTEGER_SET = {sizeof(integer_item), offsetof(integer_item, value),
                                      &ASN1_INTEGER_TYPE, DER_SET};

// Security levels and the boot state are INTEGERs, not ENUMERATED: intended, clients parse them so.
constexpr asn1_field RootOfTrust_FIELDS[] = {
    {offsetof(RootOfTrust, verified_boot_key), ASN1_NO_TAG, &ASN1_OCTET_STRING_TYPE, ASN1_ALWAYS},
    {offsetof(RootOfTrust, device_locked), ASN1_NO_TAG, &ASN1_BOOLEAN_TYPE, ASN1_ALWAYS},
    {offsetof(RootOfTrust, verified_boot_state), ASN1_NO_TAG, &ASN1_INTEGER_TYPE, ASN1_ALWAYS},
};

constexpr uint32_t tag_number(keymaster_tag_t tag) {
  return tag & ~KM_TAG_CLASS_MASK;
}

// The authorisation list, in encoding order: Keymaster tag, member, type; a flag is its presence
// byte. The context tag of a field is the number of its Keymaster tag.
#define AUTHORISATIONS(VALUE, FLAG)                                                          \
  VALUE(KM_TAG_PURPOSE, purpose, SET_OF_INTEGER_TYPE)                                        \
  VALUE(KM_TAG_ALGORITHM, algorithm, ASN1_INTEGER_TYPE)                                      \
  VALUE(KM_TAG_KEY_SIZE, key_size, ASN1_INTEGER_TYPE)                                        \
  VALUE(KM_TAG_DIGEST, digest, SET_OF_INTEGER_TYPE)                                          \
  VALUE(KM_TAG_PADDING, padding, SET_OF_INTEGER_TYPE)                                        \
  VALUE(KM_TAG_KDF, kdf, SET_OF_INTEGER_TYPE)                                                \
  VALUE(KM_TAG_EC_CURVE, ec_curve, ASN1_INTEGER_TYPE)                                        \
  VALUE(KM_TAG_RSA_PUBLIC_EXPONENT, rsa_public_exponent, ASN1_INTEGER_TYPE)                  \
  VALUE(KM_TAG_ACTIVE_DATETIME, active_date_time, ASN1_INTEGER_TYPE)                         \
  VALUE(KM_TAG_ORIGINATION_EXPIRE_DATETIME, origination_expire_date_time, ASN1_INTEGER_TYPE) \
  VALUE(KM_TAG_USAGE_EXPIRE_DATETIME, usage_expire_date_time, ASN1_INTEGER_TYPE)             \
  FLAG(KM_TAG_NO_AUTH_REQUIRED, no_auth_required)                                            \
  VALUE(KM_TAG_USER_AUTH_TYPE, user_auth_type, ASN1_INTEGER_TYPE)                            \
  VALUE(KM_TAG_AUTH_TIMEOUT, auth_timeout, ASN1_INTEGER_TYPE)                                \
  FLAG(KM_TAG_ALLOW_WHILE_ON_BODY, allow_while_on_body)                                      \
  FLAG(KM_TAG_ALL_APPLICATIONS, all_applications)                                            \
  VALUE(KM_TAG_APPLICATION_ID, application_id, ASN1_OCTET_STRING_TYPE)                       \
  VALUE(KM_TAG_CREATION_DATETIME, creation_date_time, ASN1_INTEGER_TYPE)                     \
  VALUE(KM_TAG_ORIGIN, origin, ASN1_INTEGER_TYPE)                                            \
  FLAG(KM_TAG_ROLLBACK_RESISTANT, rollback_resistant)                                        \
  VALUE(KM_TAG_ROOT_OF_TRUST, root_of_trust, RootOfTrust_TYPE)                               \
  VALUE(KM_TAG_OS_VERSION, os_version, ASN1_INTEGER_TYPE)                                    \
  VALUE(KM_TAG_OS_PATCHLEVEL, os_patch_level, ASN1_INTEGER_TYPE)

#define VALUE_FIELD(km_tag, member, type)                                                          \
  {offsetof(AuthorizationList, member), ASN1_EXPLICIT | DER_CONTEXT | tag_number(km_tag), &(type), \
   offsetof(AuthorizationList, has_##member)},
#define FLAG_FIELD(km_tag, member)                                                              \
  {offsetof(AuthorizationList, has_##member), ASN1_EXPLICIT | DER_CONTEXT | tag_number(km_tag), \
   &ASN1_NULL_TYPE, offsetof(AuthorizationList, has_##member)},
constexpr asn1_field AuthorizationList_FIELDS[] = {AUTHORISATIONS(VALUE_FIELD, FLAG_FIELD)};

// The tags of these fields, in the same order.
#define VALUE_TAG(km_tag, member, type) km_tag,
#define FLAG_TAG(km_tag, member) km_tag,
constexpr keymaster_tag_t AUTHORISATION_TAGS[] = {AUTHORISATIONS(VALUE_TAG, FLAG_TAG)};
static_assert(std::size(AUTHORISATION_TAGS) == std::size(AuthorizationList_FIELDS));

// Versions and security levels are never set: they are always these.
constexpr uint64_t ONE = 1;
constexpr uint64_t TWO = 2;
#define CONSTANT(member, value)                                        \
  {                                                                    \
    offsetof(KeyDescription, member), ASN1_NO_TAG, &ASN1_INTEGER_TYPE, \
        offsetof(KeyDescription, has_##member), &(value)               \
  }
#define PRESENT(member, type) \
  { offsetof(KeyDescription, member), ASN1_NO_TAG, &(type), ASN1_ALWAYS }

constexpr asn1_field KeyDescription_FIELDS[] = {
    CONSTANT(attestation_version, ONE),
    CONSTANT(attestation_security_level, ONE),
    CONSTANT(keymaster_version, TWO),
    CONSTANT(keymaster_security_level, ONE),
    PRESENT(attestation_challenge, ASN1_OCTET_STRING_TYPE),
    PRESENT(unique_id, ASN1_OCTET_STRING_TYPE),
    PRESENT(software_enforced, AuthorizationList_TYPE),
    PRESENT(tee_enforced, AuthorizationList_TYPE),
};

// Legal in a key, but without a field in the list. The system's own tags have the numbers 11000 to
// 11008; of these, 0x70002AFB is none.
constexpr keymaster_tag_t PASSED_OVER[] = {
    KM_TAG_INVALID,
    KM_TAG_BLOCK_MODE,
    KM_TAG_CALLER_NONCE,
    KM_TAG_MIN_MAC_LENGTH,
    KM_TAG_ECIES_SINGLE_HASH_MODE,
    KM_TAG_INCLUDE_UNIQUE_ID,
    KM_TAG_BLOB_USAGE_REQUIREMENTS,
    KM_TAG_BOOTLOADER_ONLY,
    KM_TAG_MIN_SECONDS_BETWEEN_OPS,
    KM_TAG_MAX_USES_PER_BOOT,
    KM_TAG_ALL_USERS,
    KM_TAG_USER_ID,
    KM_TAG_USER_SECURE_ID,
    KM_TAG_EXPORTABLE,
    KM_TAG_APPLICATION_DATA,
    KM_TAG_ROOT_OF_TRUST,  // the list's own is set below, never from a tag
    KM_TAG_UNIQUE_ID,
    KM_TAG_ATTESTATION_CHALLENGE,
    KM_TAG_ASSOCIATED_DATA,
    KM_TAG_NONCE,
    KM_TAG_AUTH_TOKEN,
    KM_TAG_MAC_LENGTH,
    KM_TAG_RESET_SINCE_ID_ROTATION,
    KM_TAG_SOTER_KEY,
    KM_TAG_SOTER_ATTK_SIGNS,
    KM_TAG_SOTER_KEY_SIGNS,
    KM_TAG_SOTER_SIGN_KEY_NAME,
    KM_TAG_SOTER_COUNTER,
    0x70002AFD,
    0x70002AFE,
    KM_TAG_SOTER_UID,
    KM_TAG_SOTER_SIGN_KEY_BLOB,
};

const asn1_field* field_of(keymaster_tag_t tag) {
  for (size_t i = 0; i < std::size(AUTHORISATION_TAGS); i++) {
    if (AUTHORISATION_TAGS[i] == tag) return &AuthorizationList_FIELDS[i];
  }
  return nullptr;
}

// Puts one parameter where it belongs. False when out of memory.
bool fill(const asn1_field& field, const keymaster_key_param_t& param, AuthorizationList* list) {
  auto* base = reinterpret_cast<uint8_t*>(list);
  void* value = base + field.offset;
  const uint32_t kind = tag_class(param.tag);
  if (kind == KM_ENUM_REP) {
    uint64_t* element = SET_OF_INTEGER_alloc_item(static_cast<SET_OF_INTEGER*>(value));
    if (element == nullptr) return false;
    *element = param.enumerated;
  } else if (kind == KM_BYTES) {
    auto* string = static_cast<ASN1_OCTET_STRING*>(value);
    if (ASN1_OCTET_STRING_set(string, param.blob()) != 0) return false;
  } else if (kind == KM_ENUM || kind == KM_UINT) {
    *static_cast<uint64_t*>(value) = param.integer;
  } else if (kind != KM_BOOL) {
    *static_cast<uint64_t*>(value) = param.long_integer;
  }
  base[field.presence] = 1;
  return true;
}

// What a request for a unique identifier comes to; KM_ERROR_OK when there is none.
keymaster_error_t settle_unique_id(const keymaster_key_param_set_t& hardware,
                                   ASN1_OCTET_STRING* unique_id) {
  if (!contains_tag(hardware, KM_TAG_INCLUDE_UNIQUE_ID)) return KM_ERROR_OK;
  const auto* created = get_unique(hardware, KM_TAG_CREATION_DATETIME);
  if (created == nullptr) {
    return refuse(KM_ERROR_INVALID_KEY_BLOB,
                  "Unique ID cannot be generated without creation datetime");
  }
  return generate_unique_id(unique_id, created->date_time,
                            unique_blob(hardware, KM_TAG_APPLICATION_ID),
                            contains_tag(hardware, KM_TAG_RESET_SINCE_ID_ROTATION));
}

keymaster_error_t set_challenge(const keymaster_key_param_set_t& attest_params,
                                ASN1_OCTET_STRING* challenge) {
  const auto* given = get_unique(attest_params, KM_TAG_ATTESTATION_CHALLENGE);
  if (given == nullptr) return KM_ERROR_OK;
  if (given->data_length > MAX_CHALLENGE_SIZE) return KM_ERROR_INVALID_INPUT_LENGTH;
  return der_error(ASN1_OCTET_STRING_set(challenge, given->blob()));
}

// The device is locked and verified under a fixed boot key: the platform offers no other source.
keymaster_error_t set_root_of_trust(AuthorizationList* list) {
  RootOfTrust& root = list->root_of_trust;
  const byte_view key(reinterpret_cast<const uint8_t*>(VERIFIED_BOOT_KEY),
                      sizeof(VERIFIED_BOOT_KEY) - 1);
  TRY(der_error(ASN1_OCTET_STRING_set(&root.verified_boot_key, key)));
  root.device_locked = 1;
  root.verified_boot_state = 0;
  list->has_root_of_trust = 1;
  return KM_ERROR_OK;
}

keymaster_error_t fill_description(const keymaster_key_param_set_t& hardware,
                                   const keymaster_key_param_set_t& software,
                                   const keymaster_key_param_set_t& attest_params,
                                   KeyDescription* description) {
  TRY(fill_auth_list_by_param_set(hardware, &description->tee_enforced));
  TRY(fill_auth_list_by_param_set(software, &description->software_enforced));
  TRY(settle_unique_id(hardware, &description->unique_id));
  TRY(set_challenge(attest_params, &description->attestation_challenge));
  return set_root_of_trust(&description->tee_enforced);
}

}  // namespace

KM_DEFINE_ASN1_RECORD(SET_OF_INTEGER, asn1_list_type<INTEGER_SET>)
KM_DEFINE_ASN1_RECORD(RootOfTrust, asn1_sequence<RootOfTrust_FIELDS>)
KM_DEFINE_ASN1_RECORD(AuthorizationList, asn1_sequence<AuthorizationList_FIELDS>)
KM_DEFINE_ASN1_RECORD(KeyDescription, asn1_sequence<KeyDescription_FIELDS>)

uint64_t* SET_OF_INTEGER_alloc_item(SET_OF_INTEGER* set) {
  const trace_scope scope;
  auto* item = static_cast<integer_item*>(asn1_list_add(INTEGER_SET, &set->items));
  return item == nullptr ? nullptr : &item->value;
}

keymaster_error_t fill_auth_list_by_param_set(const keymaster_key_param_set_t& set,
                                              AuthorizationList* list) {
  const trace_scope scope;
  for (const keymaster_key_param_t& param : set) {
    if (std::ranges::find(PASSED_OVER, param.tag) != std::end(PASSED_OVER)) continue;
    const asn1_field* field = field_of(param.tag);
    if (field == nullptr) {
      trace(TEE_TRACE_ERROR, "Unknown tag 0x%08x", param.tag);
      continue;
    }
    if (!fill(*field, param, list)) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return KM_ERROR_OK;
}

keymaster_error_t generate_unique_id(ASN1_OCTET_STRING*, uint64_t, byte_view, bool) {
  return KM_ERROR_UNIMPLEMENTED;
}

keymaster_error_t character_to_extension(const keymaster_key_param_set_t& hardware,
                                         const keymaster_key_param_set_t& software,
                                         const keymaster_key_param_set_t& attest_params,
                                         X509_EXTENSION* extension) {
  const trace_scope scope;
  const asn1_owner<KeyDescription, KeyDescription_free> description(KeyDescription_alloc());
  if (!description) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  TRY(fill_description(hardware, software, attest_params, description.get()));
  heap_buffer encoding;
  TRY(der_error(
      asn1_encode_growing(KeyDescription_TYPE, description.get(), FIRST_BUFFER_SIZE, &encoding)));
  extension->id = &OID_KEY_DESCRIPTION;
  return der_error(ASN1_OCTET_STRING_set(&extension->value, encoding.view()));
}

}  // namespace keymaster
