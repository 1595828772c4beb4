// Names of results, and what a person can do about each.
#include "keymaster/client/status.h"

#include <algorithm>
#include <array>
#include <cinttypes>
#include <cstdio>

namespace keymaster::client {

namespace {

struct error_row {
  keymaster_error_t error;
  std::string_view name;
};

struct advice_row {
  keymaster_error_t error;
  std::string_view advice;
};

struct tee_row {
  TEEC_Result code;
  std::string_view name;
  std::string_view advice;
};

constexpr error_row ERRORS[] = {
#define KM_NAME_ERROR(name, value) {value, #name},
    KM_ERROR_LIST(KM_NAME_ERROR)
#undef KM_NAME_ERROR
        {KM_AUTHENTICATION_DUE, "KM_AUTHENTICATION_DUE"},
};

constexpr advice_row ADVICE[] = {
    {KM_ERROR_UNSUPPORTED_PURPOSE,
     "The key's algorithm cannot do this. Use a key of another algorithm."},
    {KM_ERROR_INCOMPATIBLE_PURPOSE,
     "The key was not made for this purpose. Make one that lists the purpose."},
    {KM_ERROR_UNSUPPORTED_ALGORITHM, "The device does not offer this algorithm."},
    {KM_ERROR_UNSUPPORTED_KEY_SIZE,
     "The algorithm has no keys of this size. HMAC takes 8 to 1024 bits in whole bytes, AES 128, "
     "192 or 256 bits, RSA whole bytes up to 8192 bits, EC 224, 256, 384 or 521 bits."},
    {KM_ERROR_UNSUPPORTED_BLOCK_MODE, "The algorithm has no such block mode."},
    {KM_ERROR_INCOMPATIBLE_BLOCK_MODE,
     "The key does not allow this block mode. Ask for one that its characteristics list."},
    {KM_ERROR_UNSUPPORTED_MAC_LENGTH,
     "A GCM tag has at most 128 bits, in whole bytes. Ask for another length."},
    {KM_ERROR_UNSUPPORTED_PADDING_MODE, "The algorithm cannot use this padding."},
    {KM_ERROR_INCOMPATIBLE_PADDING_MODE,
     "The key does not allow this padding. Ask for one that its characteristics list."},
    {KM_ERROR_UNSUPPORTED_DIGEST,
     "The algorithm cannot use this digest. An HMAC key has exactly one, of SHA-1 to SHA-512."},
    {KM_ERROR_INCOMPATIBLE_DIGEST,
     "The key does not allow this digest. Ask for one that its characteristics list."},
    {KM_ERROR_UNSUPPORTED_KEY_FORMAT, "Keys of this algorithm cannot be exported."},
    {KM_ERROR_INVALID_INPUT_LENGTH, "The input has a length that the padding or mode refuses."},
    {KM_ERROR_KEY_NOT_YET_VALID, "The key's activation date lies ahead. Use it later."},
    {KM_ERROR_KEY_EXPIRED, "The key's expiry date has passed. Make a new key."},
    {KM_ERROR_KEY_USER_NOT_AUTHENTICATED,
     "The key wants its user to authenticate. Give a token of this boot for the key's user: with "
     "begin when the key has a timeout, else with update and finish and with the operation's "
     "handle as its challenge."},
    {KM_ERROR_INVALID_OPERATION_HANDLE,
     "The operation has ended: finished, aborted, or ended by a failure. Begin a new one."},
    {KM_ERROR_VERIFICATION_FAILED, "The signature or tag does not belong to this data and key."},
    {KM_ERROR_TOO_MANY_OPERATIONS,
     "Sixteen operations are live, or eight keys with use limits were used since the start. Finish "
     "or abort operations, or restart the trusted application."},
    {KM_ERROR_INVALID_KEY_BLOB,
     "Give the application id and data that the key was made with; a key made under a newer system "
     "version than the configured one is refused, too, as is a bootloader-only key."},
    {KM_ERROR_INVALID_ARGUMENT,
     "A parameter is missing, repeated or malformed, or may not be given here, or an "
     "authentication token is not of this boot. The trace names the parameter."},
    {KM_ERROR_INVALID_TAG, "A tag is repeated, or comes where it is not allowed."},
    {KM_ERROR_MEMORY_ALLOCATION_FAILED,
     "The trusted application ran out of memory, or an HMAC verification was asked for, which it "
     "always answers so: compute the MAC again and compare."},
    {KM_ERROR_IMPORT_PARAMETER_MISMATCH,
     "The size or exponent that was given differs from the imported key's. Leave it out."},
    {KM_ERROR_KEY_RATE_LIMIT_EXCEEDED, "The key was used a moment ago. Wait and try again."},
    {KM_ERROR_CALLER_NONCE_PROHIBITED,
     "The key does not allow a nonce of the caller's. Let the device choose it."},
    {KM_ERROR_KEY_MAX_OPS_EXCEEDED,
     "The key's uses are exhausted until the trusted application starts anew."},
    {KM_ERROR_INVALID_MAC_LENGTH, "The MAC is shorter than the key's minimum. Ask for more bits."},
    {KM_ERROR_MISSING_MIN_MAC_LENGTH, "A GCM key needs one minimum MAC length."},
    {KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH,
     "The minimum MAC length is a multiple of 8: for HMAC 64 bits up to the digest's length, for "
     "GCM 96 to 128."},
    {KM_ERROR_UNSUPPORTED_EC_CURVE, "The device does not offer this curve."},
    {KM_ERROR_KEY_REQUIRES_UPGRADE,
     "Upgrade the key: it was made under an older system version. If the upgrade fails, too, the "
     "blob is damaged or belongs to another device."},
    {KM_ERROR_KEYMASTER_NOT_CONFIGURED,
     "Configure the OS version and patch level before any other command."},
    {KM_ERROR_UNIMPLEMENTED, "This device does not offer the command."},
    {KM_ERROR_UNKNOWN_ERROR, "The trusted application's trace tells what failed."},
};

constexpr tee_row TEE_CODES[] = {
    {TEEC_ERROR_GENERIC, "TEE_ERROR_GENERIC", "The trusted application's trace tells what failed."},
    {TEEC_ERROR_ACCESS_DENIED, "TEE_ERROR_ACCESS_DENIED", ""},
    {TEEC_ERROR_CANCEL, "TEE_ERROR_CANCEL", ""},
    {TEEC_ERROR_ACCESS_CONFLICT, "TEE_ERROR_ACCESS_CONFLICT", "An object is in use."},
    {TEEC_ERROR_EXCESS_DATA, "TEE_ERROR_EXCESS_DATA", ""},
    {TEEC_ERROR_BAD_FORMAT, "TEE_ERROR_BAD_FORMAT",
     "The trusted application's answer is malformed; it and this program do not fit together."},
    {TEEC_ERROR_BAD_PARAMETERS, "TEE_ERROR_BAD_PARAMETERS",
     "The trusted application could not read the request."},
    {TEEC_ERROR_BAD_STATE, "TEE_ERROR_BAD_STATE", ""},
    {TEEC_ERROR_ITEM_NOT_FOUND, "TEE_ERROR_ITEM_NOT_FOUND",
     "The device folder, the trusted application or an object of it is not there."},
    {TEEC_ERROR_NOT_IMPLEMENTED, "TEE_ERROR_NOT_IMPLEMENTED", ""},
    {TEEC_ERROR_NOT_SUPPORTED, "TEE_ERROR_NOT_SUPPORTED", ""},
    {TEEC_ERROR_NO_DATA, "TEE_ERROR_NO_DATA", ""},
    {TEEC_ERROR_OUT_OF_MEMORY, "TEE_ERROR_OUT_OF_MEMORY", "Send less at a time."},
    {TEEC_ERROR_BUSY, "TEE_ERROR_BUSY", "Another process has the device open. Try again later."},
    {TEEC_ERROR_COMMUNICATION, "TEE_ERROR_COMMUNICATION", ""},
    {TEEC_ERROR_SECURITY, "TEE_ERROR_SECURITY", ""},
    {TEEC_ERROR_SHORT_BUFFER, "TEE_ERROR_SHORT_BUFFER", "The output buffer is too small."},
    {TEEC_ERROR_TARGET_DEAD, "TEE_ERROR_TARGET_DEAD",
     "The trusted application stopped. Open a new session."},
    {0xFFFF3041, "TEE_ERROR_STORAGE_NO_SPACE", "Make room where the device folder lies."},
    {0xFFFF3071, "TEE_ERROR_MAC_INVALID", ""},
    {0xFFFF3072, "TEE_ERROR_SIGNATURE_INVALID", ""},
    {0xF0100001, "TEE_ERROR_CORRUPT_OBJECT",
     "What the device has stored is damaged or exchanged; 'kmtool device check' lists it."},
    {0xF0100003, "TEE_ERROR_STORAGE_NOT_AVAILABLE",
     "The device's storage cannot be read. Look at the device folder."},
};

const tee_row* find_tee_row(TEEC_Result code) {
  const tee_row* row = std::ranges::find(TEE_CODES, code, &tee_row::code);
  return row == std::end(TEE_CODES) ? nullptr : row;
}

std::string_view origin_name(uint32_t origin) {
  switch (origin) {
    case TEEC_ORIGIN_API:
      return "the client library";
    case TEEC_ORIGIN_COMMS:
      return "the way to the TEE";
    case TEEC_ORIGIN_TEE:
      return "the TEE";
    case TEEC_ORIGIN_TRUSTED_APP:
      return "the trusted application";
    default:
      return "an unknown origin";
  }
}

std::string tee_text(TEEC_Result code, uint32_t origin) {
  char number[16];
  snprintf(number, sizeof(number), "0x%08" PRIx32, code);
  return std::string(tee_name(code)) + " (" + number + ") from " + std::string(origin_name(origin));
}

}  // namespace

std::string_view error_name(keymaster_error_t error) {
  const error_row* row = std::ranges::find(ERRORS, error, &error_row::error);
  return row == std::end(ERRORS) ? "unknown Keymaster error" : row->name;
}

std::string_view tee_name(TEEC_Result code) {
  if (code == TEEC_SUCCESS) return "TEE_SUCCESS";
  const tee_row* row = find_tee_row(code);
  return row ? row->name : "unknown TEE error";
}

std::string status::text() const {
  if (ok()) return "done";
  std::string line;
  if (error != KM_ERROR_OK) {
    line = std::string(error_name(error)) + " (" + std::to_string(error) + ")";
  }
  if (tee != TEEC_SUCCESS) {
    line += line.empty() ? "" : ", ";
    line += tee_text(tee, origin);
  }
  return line;
}

std::string_view status::advice() const {
  if (error != KM_ERROR_OK) {
    const advice_row* row = std::ranges::find(ADVICE, error, &advice_row::error);
    if (row != std::end(ADVICE)) return row->advice;
  }
  const tee_row* row = find_tee_row(tee);
  return row ? row->advice : "";
}

}  // namespace keymaster::client
