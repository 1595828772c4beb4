// Owners over the TEE Client API.
#include "keymaster/client/connection.h"

#include <utility>

namespace keymaster::client {

context::context(const std::string& folder) {
  auto opened = std::make_unique<TEEC_Context>();
  TEEC_Result result =
      TEEC_InitializeContext(folder.empty() ? nullptr : folder.c_str(), opened.get());
  if (result != TEEC_SUCCESS) throw open_error({result, TEEC_ORIGIN_TEE});
  context_ = std::shared_ptr<TEEC_Context>(opened.release(), [](TEEC_Context* tee) {
    TEEC_FinalizeContext(tee);
    delete tee;
  });
}

connection::connection(context tee, const TEEC_UUID& application) : tee_(std::move(tee)) {
  uint32_t origin = TEEC_ORIGIN_API;
  TEEC_Result result = TEEC_OpenSession(tee_.get(), &session_, &application, TEEC_LOGIN_PUBLIC,
                                        nullptr, nullptr, &origin);
  if (result != TEEC_SUCCESS) throw open_error({result, origin});
}

connection::~connection() {
  TEEC_CloseSession(&session_);
}

status connection::invoke(uint32_t command, uint32_t types, parameter_slots* slots) {
  TEEC_Operation operation{};
  operation.paramTypes = types;
  std::copy(slots->begin(), slots->end(), operation.params);
  uint32_t origin = TEEC_ORIGIN_API;
  TEEC_Result result = TEEC_InvokeCommand(&session_, command, &operation, &origin);
  std::copy(std::begin(operation.params), std::end(operation.params), slots->begin());
  return {result, origin};
}

}  // namespace keymaster::client
