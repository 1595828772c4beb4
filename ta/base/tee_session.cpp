// The owner of a session.
#include "ta/base/tee_session.h"

namespace keymaster {

tee_session::~tee_session() {
  if (handle_ != TEE_TASessionHandle{}) TEE_CloseTASession(handle_);
}

TEE_Result tee_session::open(const TEE_UUID& application, uint32_t timeout) {
  return TEE_OpenTASession(&application, timeout, 0, nullptr, &handle_, nullptr);
}

TEE_Result tee_session::invoke(uint32_t command, uint32_t types, TEE_Param* params) {
  return TEE_InvokeTACommand(handle_, TEE_TIMEOUT_INFINITE, command, types, params, nullptr);
}

}  // namespace keymaster
