// Parameters on their way from one trusted application to another: values by copy, memory by copy,
// so that the callee neither sees nor touches memory of the caller.
#pragma once

#include "tee_internal_api.h"

#include <array>

#include "tee/core/session.h"
#include "tee/device/secret_bytes.h"

namespace tee {

constexpr bool is_memref(uint32_t type) {
  return type >= TEE_PARAM_TYPE_MEMREF_INPUT;
}

// is_param_type: whether four bits name a type at all.
constexpr bool is_param_type(uint32_t type) {
  return type <= TEE_PARAM_TYPE_VALUE_INOUT ||
         (type >= TEE_PARAM_TYPE_MEMREF_INPUT && type <= TEE_PARAM_TYPE_MEMREF_INOUT);
}

class ta_parameters {
 public:
  // Copies in what the callee gets: unused slots and value outputs are zero, output memory is as
  // long as the caller's and zero-filled. Panics in the name of `call` when types, parameters or
  // memory references break a rule.
  ta_parameters(const char* call, uint32_t types, const TEE_Param* callers);

  call_parameters* for_callee() { return &callee_; }

  // copy_back: gives the caller its outputs. A memory reference's size becomes the callee's; its
  // bytes are copied when they fit the caller's size.
  void copy_back(TEE_Param* callers) const;

 private:
  call_parameters callee_;
  std::array<secret_bytes, PARAM_COUNT> memory_;
};

}  // namespace tee
