// Parameters on their way from the normal world to a trusted application.
#pragma once

#include "tee_client_api.h"
#include "tee_internal_api.h"

#include <array>
#include <memory>

#include "tee/client/teec_state.h"
#include "tee/core/session.h"

namespace tee {

// Memory is not copied: the trusted application works in the client's own memory, temporary or
// registered, which other threads of the client can change at any time.
class teec_parameters {
 public:
  // take: translates the operation's types and parameters (null: none); unused slots and value
  // outputs are zero. TEEC_ERROR_BAD_PARAMETERS for unknown types, null buffers with a size, memory
  // that is not registered with `context`, ranges that leave it, directions that it does not allow.
  [[nodiscard]] TEEC_Result take(const void* context, const TEEC_Operation* operation);

  call_parameters* for_callee() { return &callee_; }

  // give_back: values and sizes of outputs; a size may exceed the capacity (what was needed).
  void give_back(TEEC_Operation* operation) const;

 private:
  TEEC_Result take_slot(const void* context, uint32_t type, const TEEC_Parameter& from,
                        size_t slot);
  TEEC_Result take_registered(const void* context, uint32_t type,
                              const TEEC_RegisteredMemoryReference& from, size_t slot);
  void set_slot(size_t slot, uint32_t type, void* buffer, size_t size);

  call_parameters callee_;
  std::array<std::shared_ptr<client_memory>, PARAM_COUNT> memory_;  // lives as long as the call
};

}  // namespace tee
