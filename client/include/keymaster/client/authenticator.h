// Authentication tokens, which the device's authenticator issues for keys that are bound to a user.
#pragma once

#include "keymaster/client/connection.h"
#include "keymaster/client/session.h"
#include "keymaster/uuids.h"

namespace keymaster::client {

constexpr TEEC_UUID AUTHENTICATOR_UUID = AUTHENTICATOR_TA_UUID;

constexpr size_t AUTH_TOKEN_LENGTH = 69;

// What a token says: who authenticated, by what means, for which operation.
struct token_request {
  uint64_t user_id = 0;
  uint64_t authenticator_id = 0;
  uint32_t type = KM_AUTH_TYPE_PASSWORD;  // one bit of KM_TAG_USER_AUTH_TYPE
  uint64_t challenge = 0;                 // an operation's handle, or 0 for begin
};

class authenticator {
 public:
  // Throws open_error.
  explicit authenticator(context tee) : connection_(std::move(tee), AUTHENTICATOR_UUID) {}

  // issue: a token of AUTH_TOKEN_LENGTH bytes, valid until the device's next boot, carrying the
  // current time.
  data_result issue(const token_request& request);

 private:
  connection connection_;
};

}  // namespace keymaster::client
