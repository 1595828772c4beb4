// The Keymaster numbers: tags, error codes and enumerations, each once. The lists are macros so
// that a table of names (the client library has one) is made from the same lines.
#pragma once

#include <cstdint>

namespace keymaster {

using keymaster_tag_t = uint32_t;
using keymaster_error_t = int32_t;

// A tag's top four bits are its class: what kind of value the parameter holds.
constexpr uint32_t KM_TAG_CLASS_MASK = 0xF0000000;
constexpr uint32_t KM_INVALID = 0x00000000;
constexpr uint32_t KM_ENUM = 0x10000000;
constexpr uint32_t KM_ENUM_REP = 0x20000000;
constexpr uint32_t KM_UINT = 0x30000000;
constexpr uint32_t KM_UINT_REP = 0x40000000;
constexpr uint32_t KM_ULONG = 0x50000000;
constexpr uint32_t KM_DATE = 0x60000000;
constexpr uint32_t KM_BOOL = 0x70000000;
constexpr uint32_t KM_BIGNUM = 0x80000000;
constexpr uint32_t KM_BYTES = 0x90000000;
constexpr uint32_t KM_ULONG_REP = 0xA0000000;

constexpr uint32_t tag_class(keymaster_tag_t tag) {
  return tag & KM_TAG_CLASS_MASK;
}

// Whether parameters with this tag carry a blob (bytes with a length) beside the record.
constexpr bool has_blob(keymaster_tag_t tag) {
  return tag_class(tag) == KM_BIGNUM || tag_class(tag) == KM_BYTES;
}

// X(name, value)
#define KM_TAG_LIST(X)                                 \
  X(KM_TAG_INVALID, KM_INVALID | 0)                    \
  X(KM_TAG_PURPOSE, KM_ENUM_REP | 1)                   \
  X(KM_TAG_ALGORITHM, KM_ENUM | 2)                     \
  X(KM_TAG_KEY_SIZE, KM_UINT | 3)                      \
  X(KM_TAG_BLOCK_MODE, KM_ENUM_REP | 4)                \
  X(KM_TAG_DIGEST, KM_ENUM_REP | 5)                    \
  X(KM_TAG_PADDING, KM_ENUM_REP | 6)                   \
  X(KM_TAG_CALLER_NONCE, KM_BOOL | 7)                  \
  X(KM_TAG_MIN_MAC_LENGTH, KM_UINT | 8)                \
  X(KM_TAG_KDF, KM_ENUM_REP | 9)                       \
  X(KM_TAG_EC_CURVE, KM_ENUM | 10)                     \
  X(KM_TAG_RSA_PUBLIC_EXPONENT, KM_ULONG | 200)        \
  X(KM_TAG_ECIES_SINGLE_HASH_MODE, KM_BOOL | 201)      \
  X(KM_TAG_INCLUDE_UNIQUE_ID, KM_BOOL | 202)           \
  X(KM_TAG_BLOB_USAGE_REQUIREMENTS, KM_ENUM | 301)     \
  X(KM_TAG_BOOTLOADER_ONLY, KM_BOOL | 302)             \
  X(KM_TAG_ACTIVE_DATETIME, KM_DATE | 400)             \
  X(KM_TAG_ORIGINATION_EXPIRE_DATETIME, KM_DATE | 401) \
  X(KM_TAG_USAGE_EXPIRE_DATETIME, KM_DATE | 402)       \
  X(KM_TAG_MIN_SECONDS_BETWEEN_OPS, KM_UINT | 403)     \
  X(KM_TAG_MAX_USES_PER_BOOT, KM_UINT | 404)           \
  X(KM_TAG_ALL_USERS, KM_BOOL | 500)                   \
  X(KM_TAG_USER_ID, KM_UINT | 501)                     \
  X(KM_TAG_USER_SECURE_ID, KM_ULONG_REP | 502)         \
  X(KM_TAG_NO_AUTH_REQUIRED, KM_BOOL | 503)            \
  X(KM_TAG_USER_AUTH_TYPE, KM_ENUM | 504)              \
  X(KM_TAG_AUTH_TIMEOUT, KM_UINT | 505)                \
  X(KM_TAG_ALLOW_WHILE_ON_BODY, KM_BOOL | 506)         \
  X(KM_TAG_ALL_APPLICATIONS, KM_BOOL | 600)            \
  X(KM_TAG_APPLICATION_ID, KM_BYTES | 601)             \
  X(KM_TAG_EXPORTABLE, KM_BOOL | 602)                  \
  X(KM_TAG_APPLICATION_DATA, KM_BYTES | 700)           \
  X(KM_TAG_CREATION_DATETIME, KM_DATE | 701)           \
  X(KM_TAG_ORIGIN, KM_ENUM | 702)                      \
  X(KM_TAG_ROLLBACK_RESISTANT, KM_BOOL | 703)          \
  X(KM_TAG_ROOT_OF_TRUST, KM_BYTES | 704)              \
  X(KM_TAG_OS_VERSION, KM_UINT | 705)                  \
  X(KM_TAG_OS_PATCHLEVEL, KM_UINT | 706)               \
  X(KM_TAG_UNIQUE_ID, KM_BYTES | 707)                  \
  X(KM_TAG_ATTESTATION_CHALLENGE, KM_BYTES | 708)      \
  X(KM_TAG_ATTESTATION_APPLICATION_ID, KM_BYTES | 709) \
  X(KM_TAG_ASSOCIATED_DATA, KM_BYTES | 1000)           \
  X(KM_TAG_NONCE, KM_BYTES | 1001)                     \
  X(KM_TAG_AUTH_TOKEN, KM_BYTES | 1002)                \
  X(KM_TAG_MAC_LENGTH, KM_UINT | 1003)                 \
  X(KM_TAG_RESET_SINCE_ID_ROTATION, KM_BOOL | 1004)    \
  X(KM_TAG_SOTER_KEY, KM_BOOL | 11000)                 \
  X(KM_TAG_SOTER_ATTK_SIGNS, KM_BOOL | 11001)          \
  X(KM_TAG_SOTER_KEY_SIGNS, KM_BOOL | 11002)           \
  X(KM_TAG_SOTER_SIGN_KEY_NAME, KM_BYTES | 11003)      \
  X(KM_TAG_SOTER_COUNTER, KM_BOOL | 11004)             \
  X(KM_TAG_SOTER_UID, KM_UINT | 11007)                 \
  X(KM_TAG_SOTER_SIGN_KEY_BLOB, KM_BYTES | 11008)

// X(name, value). Failures are negative; 15 is begin's "authentication is still due".
#define KM_ERROR_LIST(X)                                  \
  X(KM_ERROR_OK, 0)                                       \
  X(KM_ERROR_ROOT_OF_TRUST_ALREADY_SET, -1)               \
  X(KM_ERROR_UNSUPPORTED_PURPOSE, -2)                     \
  X(KM_ERROR_INCOMPATIBLE_PURPOSE, -3)                    \
  X(KM_ERROR_UNSUPPORTED_ALGORITHM, -4)                   \
  X(KM_ERROR_INCOMPATIBLE_ALGORITHM, -5)                  \
  X(KM_ERROR_UNSUPPORTED_KEY_SIZE, -6)                    \
  X(KM_ERROR_UNSUPPORTED_BLOCK_MODE, -7)                  \
  X(KM_ERROR_INCOMPATIBLE_BLOCK_MODE, -8)                 \
  X(KM_ERROR_UNSUPPORTED_MAC_LENGTH, -9)                  \
  X(KM_ERROR_UNSUPPORTED_PADDING_MODE, -10)               \
  X(KM_ERROR_INCOMPATIBLE_PADDING_MODE, -11)              \
  X(KM_ERROR_UNSUPPORTED_DIGEST, -12)                     \
  X(KM_ERROR_INCOMPATIBLE_DIGEST, -13)                    \
  X(KM_ERROR_INVALID_EXPIRATION_TIME, -14)                \
  X(KM_ERROR_INVALID_USER_ID, -15)                        \
  X(KM_ERROR_INVALID_AUTHORIZATION_TIMEOUT, -16)          \
  X(KM_ERROR_UNSUPPORTED_KEY_FORMAT, -17)                 \
  X(KM_ERROR_INCOMPATIBLE_KEY_FORMAT, -18)                \
  X(KM_ERROR_UNSUPPORTED_KEY_ENCRYPTION_ALGORITHM, -19)   \
  X(KM_ERROR_UNSUPPORTED_KEY_VERIFICATION_ALGORITHM, -20) \
  X(KM_ERROR_INVALID_INPUT_LENGTH, -21)                   \
  X(KM_ERROR_KEY_EXPORT_OPTIONS_INVALID, -22)             \
  X(KM_ERROR_DELEGATION_NOT_ALLOWED, -23)                 \
  X(KM_ERROR_KEY_NOT_YET_VALID, -24)                      \
  X(KM_ERROR_KEY_EXPIRED, -25)                            \
  X(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, -26)             \
  X(KM_ERROR_OUTPUT_PARAMETER_NULL, -27)                  \
  X(KM_ERROR_INVALID_OPERATION_HANDLE, -28)               \
  X(KM_ERROR_INSUFFICIENT_BUFFER_SPACE, -29)              \
  X(KM_ERROR_VERIFICATION_FAILED, -30)                    \
  X(KM_ERROR_TOO_MANY_OPERATIONS, -31)                    \
  X(KM_ERROR_UNEXPECTED_NULL_POINTER, -32)                \
  X(KM_ERROR_INVALID_KEY_BLOB, -33)                       \
  X(KM_ERROR_IMPORTED_KEY_NOT_ENCRYPTED, -34)             \
  X(KM_ERROR_IMPORTED_KEY_DECRYPTION_FAILED, -35)         \
  X(KM_ERROR_IMPORTED_KEY_NOT_SIGNED, -36)                \
  X(KM_ERROR_IMPORTED_KEY_VERIFICATION_FAILED, -37)       \
  X(KM_ERROR_INVALID_ARGUMENT, -38)                       \
  X(KM_ERROR_UNSUPPORTED_TAG, -39)                        \
  X(KM_ERROR_INVALID_TAG, -40)                            \
  X(KM_ERROR_MEMORY_ALLOCATION_FAILED, -41)               \
  X(KM_ERROR_IMPORT_PARAMETER_MISMATCH, -44)              \
  X(KM_ERROR_SECURE_HW_ACCESS_DENIED, -45)                \
  X(KM_ERROR_OPERATION_CANCELLED, -46)                    \
  X(KM_ERROR_CONCURRENT_ACCESS_CONFLICT, -47)             \
  X(KM_ERROR_SECURE_HW_BUSY, -48)                         \
  X(KM_ERROR_SECURE_HW_COMMUNICATION_FAILED, -49)         \
  X(KM_ERROR_UNSUPPORTED_EC_FIELD, -50)                   \
  X(KM_ERROR_MISSING_NONCE, -51)                          \
  X(KM_ERROR_INVALID_NONCE, -52)                          \
  X(KM_ERROR_MISSING_MAC_LENGTH, -53)                     \
  X(KM_ERROR_KEY_RATE_LIMIT_EXCEEDED, -54)                \
  X(KM_ERROR_CALLER_NONCE_PROHIBITED, -55)                \
  X(KM_ERROR_KEY_MAX_OPS_EXCEEDED, -56)                   \
  X(KM_ERROR_INVALID_MAC_LENGTH, -57)                     \
  X(KM_ERROR_MISSING_MIN_MAC_LENGTH, -58)                 \
  X(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH, -59)             \
  X(KM_ERROR_UNSUPPORTED_KDF, -60)                        \
  X(KM_ERROR_UNSUPPORTED_EC_CURVE, -61)                   \
  X(KM_ERROR_KEY_REQUIRES_UPGRADE, -62)                   \
  X(KM_ERROR_ATTESTATION_CHALLENGE_MISSING, -63)          \
  X(KM_ERROR_KEYMASTER_NOT_CONFIGURED, -64)               \
  X(KM_ERROR_ATTESTATION_APPLICATION_ID_MISSING, -65)     \
  X(KM_ERROR_CANNOT_ATTEST_IDS, -66)                      \
  X(KM_ERROR_UNIMPLEMENTED, -100)                         \
  X(KM_ERROR_VERSION_MISMATCH, -101)                      \
  X(KM_ERROR_UNKNOWN_ERROR, -1000)

#define KM_DEFINE_TAG(name, value) constexpr keymaster_tag_t name = value;
#define KM_DEFINE_ERROR(name, value) constexpr keymaster_error_t name = value;
KM_TAG_LIST(KM_DEFINE_TAG)
KM_ERROR_LIST(KM_DEFINE_ERROR)
#undef KM_DEFINE_TAG
#undef KM_DEFINE_ERROR

// Begin goes on, but a token must come with update or finish.
constexpr keymaster_error_t KM_AUTHENTICATION_DUE = 15;

constexpr uint32_t KM_ALGORITHM_RSA = 1;
constexpr uint32_t KM_ALGORITHM_EC = 3;
constexpr uint32_t KM_ALGORITHM_AES = 32;
constexpr uint32_t KM_ALGORITHM_HMAC = 128;

constexpr uint32_t KM_PURPOSE_ENCRYPT = 0;
constexpr uint32_t KM_PURPOSE_DECRYPT = 1;
constexpr uint32_t KM_PURPOSE_SIGN = 2;
constexpr uint32_t KM_PURPOSE_VERIFY = 3;

constexpr uint32_t KM_MODE_ECB = 1;
constexpr uint32_t KM_MODE_CBC = 2;
constexpr uint32_t KM_MODE_CTR = 3;
constexpr uint32_t KM_MODE_GCM = 32;

constexpr uint32_t KM_PAD_NONE = 1;
constexpr uint32_t KM_PAD_RSA_OAEP = 2;
constexpr uint32_t KM_PAD_RSA_PSS = 3;
constexpr uint32_t KM_PAD_RSA_PKCS1_1_5_ENCRYPT = 4;
constexpr uint32_t KM_PAD_RSA_PKCS1_1_5_SIGN = 5;
constexpr uint32_t KM_PAD_PKCS7 = 64;

constexpr uint32_t KM_DIGEST_NONE = 0;
constexpr uint32_t KM_DIGEST_MD5 = 1;
constexpr uint32_t KM_DIGEST_SHA1 = 2;
constexpr uint32_t KM_DIGEST_SHA_2_224 = 3;
constexpr uint32_t KM_DIGEST_SHA_2_256 = 4;
constexpr uint32_t KM_DIGEST_SHA_2_384 = 5;
constexpr uint32_t KM_DIGEST_SHA_2_512 = 6;

constexpr uint32_t KM_ORIGIN_GENERATED = 0;
constexpr uint32_t KM_ORIGIN_IMPORTED = 2;

constexpr uint32_t KM_EC_CURVE_P_224 = 0;
constexpr uint32_t KM_EC_CURVE_P_256 = 1;
constexpr uint32_t KM_EC_CURVE_P_384 = 2;
constexpr uint32_t KM_EC_CURVE_P_521 = 3;

// KM_TAG_USER_AUTH_TYPE and a token's authenticator type: a bit mask.
constexpr uint32_t KM_AUTH_TYPE_PASSWORD = 1;
constexpr uint32_t KM_AUTH_TYPE_FINGERPRINT = 2;

}  // namespace keymaster
