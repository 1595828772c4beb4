// The authenticator's one command.
#include "keymaster/client/authenticator.h"

namespace keymaster::client {

namespace {

constexpr uint32_t ISSUE_TOKEN = 1;

}  // namespace

data_result authenticator::issue(const token_request& request) {
  bytes input = field_writer()
                    .u64(request.challenge)
                    .u64(request.user_id)
                    .u64(request.authenticator_id)
                    .u32(request.type)
                    .take();
  bytes token(AUTH_TOKEN_LENGTH);
  parameter_slots slots{};
  slots[0].tmpref = {input.data(), input.size()};
  slots[1].tmpref = {token.data(), token.size()};
  status outcome = connection_.invoke(
      ISSUE_TOKEN,
      TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE, TEEC_NONE),
      &slots);
  if (outcome.ok() && slots[1].tmpref.size != AUTH_TOKEN_LENGTH) {
    outcome = {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API};
  }
  if (!outcome.ok()) return {{outcome}, {}};
  return {{outcome}, std::move(token)};
}

}  // namespace keymaster::client
