// How a command ended, as the program sees it and as a person reads it.
#pragma once

#include "tee_client_api.h"

#include <stdexcept>
#include <string>
#include <string_view>

#include "keymaster/tags.h"

namespace keymaster::client {

// The three results of a command: the TEE's code, who made it (TEEC_ORIGIN_...), and the Keymaster
// error. Both codes can tell of a failure at once; a command is done when neither does.
struct status {
  TEEC_Result tee = TEEC_SUCCESS;
  uint32_t origin = TEEC_ORIGIN_TRUSTED_APP;
  keymaster_error_t error = KM_ERROR_OK;

  bool ok() const { return tee == TEEC_SUCCESS && error == KM_ERROR_OK; }

  // text: one line that names every code that tells of a failure, such as
  // "KM_ERROR_INVALID_KEY_BLOB (-33)" or "TEE_ERROR_GENERIC (0xffff0000) from the trusted
  // application"; "done" when there is none.
  std::string text() const;

  // advice: what went wrong in a sentence and what to do about it; empty when there is nothing to
  // say beyond text().
  std::string_view advice() const;
};

// An answer that is not in its form.
inline constexpr status MALFORMED = {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API};

// A TEE that cannot be reached: no context or no session.
class open_error : public std::runtime_error {
 public:
  explicit open_error(const status& reason) : std::runtime_error(reason.text()), reason_(reason) {}
  const status& reason() const { return reason_; }

 private:
  status reason_;
};

// error_name: "KM_ERROR_INVALID_KEY_BLOB" for -33; "unknown Keymaster error" for a number that is
// none.
std::string_view error_name(keymaster_error_t error);

// tee_name: "TEE_ERROR_GENERIC" for 0xffff0000; "unknown TEE error" for a code that is none.
std::string_view tee_name(TEEC_Result code);

}  // namespace keymaster::client
