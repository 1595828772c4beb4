// SOTER: the device's attestation key (ATTK), reports of fingerprints, and the signed documents
// that SOTER keys make instead of bare signatures.
#pragma once

#include <optional>
#include <string>

#include "keymaster/client/connection.h"
#include "keymaster/client/session.h"
#include "keymaster/uuids.h"

namespace keymaster::client {

constexpr TEEC_UUID FINGERPRINT_UUID = FINGERPRINT_TA_UUID;

// What became of the ATTK that the factory gave the device.
enum class attk_state : int32_t {
  READY = 0,
  NOT_PROVISIONED = -1,
  UNREADABLE = -2,
};

struct attk_result : status {
  attk_state state = attk_state::UNREADABLE;  // when the status is ok
};

// Commands whose errors have meanings of their own say so in `unavailable`.
struct soter_result : status {
  bytes data = {};
  bool unavailable = false;  // the device's SOTER data cannot be loaded
};

// soter: the SOTER commands of the Keymaster. They work without configure.
class soter {
 public:
  // The session must outlive this.
  explicit soter(session* keymaster) : keymaster_(keymaster) {}

  // check_attk: fetches the ATTK from the vault and says whether it is there.
  attk_result check_attk();

  // export_attk: the ATTK's public key as PEM text (RFC 7468), without a line feed at its end.
  soter_result export_attk();

  // device_id: the identifier that the factory gave the device.
  soter_result device_id();

 private:
  soter_result fetch(uint32_t command);

  session* keymaster_;
};

// fingerprint_sensor: the device's fingerprint application, which reports matches to the Keymaster.
// A report serves the documents of the next three seconds in the life of the Keymaster's instance,
// so a session with the Keymaster should be open.
class fingerprint_sensor {
 public:
  // Throws open_error.
  explicit fingerprint_sensor(context tee) : connection_(std::move(tee), FINGERPRINT_UUID) {}

  // report_match: the finger with this identifier was recognised just now.
  status report_match(uint32_t fid);

 private:
  connection connection_;
};

// A document as the signature covers it: JSON text and the zero byte that ends it.
struct signed_document {
  bytes document;
  bytes signature;  // RSA, as long as the signing key's modulus

  // text: the document without its zero byte.
  std::string_view text() const;
};

// parse_signed_document: what a SOTER key's finish or export_key puts out: u32 little-endian length
// N, N bytes of document with its zero byte, signature. Throws format_error for anything else.
signed_document parse_signed_document(byte_view output);

}  // namespace keymaster::client
