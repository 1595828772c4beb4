// The owner of a session with a sibling trusted application.
#pragma once

#include "tee_internal_api.h"

namespace keymaster {

// tee_session: owns a session with another trusted application. Calls trace nothing: who calls says
// what failed in its own words.
class tee_session {
 public:
  tee_session() = default;
  tee_session(const tee_session&) = delete;
  tee_session& operator=(const tee_session&) = delete;
  ~tee_session();

  // Once; `timeout` in ms.
  [[nodiscard]] TEE_Result open(const TEE_UUID& application, uint32_t timeout);
  // Without a limit in time. Sizes that come back in `params` are the other side's word: hold them
  // against the buffers.
  [[nodiscard]] TEE_Result invoke(uint32_t command, uint32_t types, TEE_Param* params);

 private:
  TEE_TASessionHandle handle_{};
};

}  // namespace keymaster
