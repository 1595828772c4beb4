// Sessions with instances as their clients see them: what trusted applications, through the API,
// and the normal world ask of whoever runs the instances. The host implements it.
#pragma once

#include "tee_internal_api.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "tee/core/cancellation.h"

namespace tee {

class instance;

constexpr size_t PARAM_COUNT = 4;

// The parameters of a call as the entry points take them: unused slots and value outputs are zero.
// Memory is the caller's, who keeps it until the call has ended. Outputs are written in place.
struct call_parameters {
  uint32_t types = 0;  // TEE_PARAM_TYPE_, 4 bits a slot
  std::array<TEE_Param, PARAM_COUNT> slots{};
  const cancellation* asked = nullptr;  // what can end the call early; outlives it
};

// How a call ended, and who says so (TEE_ORIGIN_): the trusted application, whose outputs then
// count whatever the code is, or the TEE.
struct [[nodiscard]] call_result {
  TEE_Result code = TEE_SUCCESS;
  uint32_t origin = TEE_ORIGIN_TEE;
};

// An open session. Calls may come from several threads and wait for each other.
class session {
 public:
  session() = default;
  session(const session&) = delete;
  session& operator=(const session&) = delete;
  virtual ~session() = default;  // closes it

  // invoke: runs the command. Codes of the TEE: TEE_ERROR_BUSY when the instance waits for the
  // caller; TEE_ERROR_CANCEL when that was requested before the command began;
  // TEE_ERROR_TARGET_DEAD when the trusted application fails in this call or has failed before, and
  // after close.
  virtual call_result invoke(uint32_t command, call_parameters* parameters) = 0;

  // close: runs the close entry point and lets go of the instance. When the instance is busy,
  // whoever leaves it runs the entry point: a close waits for nobody. A second time has no effect.
  virtual void close() = 0;

  virtual bool is_with(const instance& target) const = 0;
};

// Whoever runs the instances of a device.
class session_opener {
 public:
  // open_session: makes the instance of `destination` when there is none, runs its create entry
  // point when it is new, and its open entry point. Codes of the TEE: TEE_ERROR_ITEM_NOT_FOUND when
  // there is no such trusted application, TEE_ERROR_BAD_FORMAT when it cannot be loaded,
  // TEE_ERROR_BUSY when the instance waits for the caller or takes no further session,
  // TEE_ERROR_CANCEL and TEE_ERROR_TARGET_DEAD as invoke, TEE_ERROR_OUT_OF_MEMORY. The opener must
  // outlive the session.
  virtual call_result open_session(const TEE_UUID& destination, const TEE_Identity& client,
                                   call_parameters* parameters,
                                   std::shared_ptr<session>* opened) = 0;

 protected:
  ~session_opener() = default;
};

}  // namespace tee
