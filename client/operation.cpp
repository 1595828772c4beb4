// Feeding and ending operations.
#include "keymaster/client/operation.h"

namespace keymaster::client {

namespace {

constexpr status NOT_LIVE = {TEEC_SUCCESS, TEEC_ORIGIN_API, KM_ERROR_INVALID_OPERATION_HANDLE};

}  // namespace

operation::operation(session* keymaster, const begin_result& begun)
    : keymaster_(keymaster), handle_(begun.handle), live_(begun.ok()) {}

operation::~operation() {
  if (!live_) return;
  try {
    keymaster_->abort(handle_);
  } catch (const std::exception&) {
    // No memory for the command: the handle is freed with the instance.
  }
}

status operation::update(byte_view input, bytes* output, const param_set& params) {
  if (!live_) return NOT_LIVE;
  do {
    update_result step = keymaster_->update(handle_, input, params);
    if (!step.ok()) {
      // The TA has ended it, unless it was this side that refused the answer.
      live_ = step.origin == TEEC_ORIGIN_API;
      return step;
    }
    append(output, step.output);
    if (step.consumed == 0 && !input.empty()) {
      return {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API};  // it would never end
    }
    input = input.subspan(step.consumed);
  } while (!input.empty());
  return {};
}

finish_result operation::finish(byte_view signature, const param_set& params, size_t room) {
  if (!live_) return {{NOT_LIVE}, {}, {}};
  live_ = false;
  return keymaster_->finish(handle_, signature, params, room);
}

}  // namespace keymaster::client
