// A session of a client, from the normal world or a trusted application, with an instance.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <memory>
#include <utility>

#include "tee/runtime/ta_host.h"

namespace tee {

// Parameters are as the entry points take them: unused slots and value outputs are zero. Calls may
// come from several threads and wait for each other. `origin` (TEE_ORIGIN_) says who made the
// result: the trusted application, whose outputs then count whatever the result is, or the TEE.
class ta_session {
 public:
  // open: makes the instance when there is none, runs its create entry point when it is new, and
  // its open entry point. Codes of the TEE: as ta_library::load; TEE_ERROR_BUSY when the instance
  // waits for the caller; TEE_ERROR_OUT_OF_MEMORY.
  [[nodiscard]] static TEE_Result open(ta_host& host, const TEE_UUID& destination,
                                       const TEE_Identity& client, uint32_t types,
                                       TEE_Param* params, std::shared_ptr<ta_session>* session,
                                       uint32_t* origin);

  // What open makes its results with.
  ta_session(std::shared_ptr<ta_instance> target, const TEE_Identity& client)
      : target_(std::move(target)), client_(client) {}
  ta_session(const ta_session&) = delete;
  ta_session& operator=(const ta_session&) = delete;

  ~ta_session() { end(); }

  // end: runs the close entry point and lets go of the instance.
  void end();

  bool is_with(const ta_instance& instance) const { return target_.get() == &instance; }

  // invoke: runs the command. TEE_ERROR_BUSY as above; TEE_ERROR_TARGET_DEAD after end.
  [[nodiscard]] TEE_Result invoke(uint32_t command, uint32_t types, TEE_Param* params,
                                  uint32_t* origin);

 private:
  std::shared_ptr<ta_instance> target_;
  TEE_Identity client_;
  void* context_ = nullptr;
  bool open_ = false;
};

}  // namespace tee
