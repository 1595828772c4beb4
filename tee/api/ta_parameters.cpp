// Parameters on their way from one trusted application to another.
#include "tee/api/ta_parameters.h"

#include <algorithm>

#include "tee/core/panic.h"

namespace tee {

ta_parameters::ta_parameters(const char* call, uint32_t types, const TEE_Param* callers) {
  if (types >> (4 * PARAM_COUNT) != 0) panic(call, "paramTypes 0x%x has unknown bits", types);
  if (types != 0 && callers == nullptr) panic(call, "params is null");
  callee_.types = types;
  for (size_t i = 0; i < PARAM_COUNT; i++) {
    uint32_t type = TEE_PARAM_TYPE_GET(types, i);
    if (!is_param_type(type)) panic(call, "paramTypes 0x%x: type of slot %zu is unknown", types, i);
    if (type == TEE_PARAM_TYPE_VALUE_INPUT || type == TEE_PARAM_TYPE_VALUE_INOUT) {
      callee_.slots[i].value = callers[i].value;
    }
    if (!is_memref(type)) continue;
    auto [buffer, size] = callers[i].memref;
    if (buffer == nullptr && size != 0) panic(call, "buffer of slot %zu is null", i);
    if (buffer == nullptr) continue;
    memory_[i].reserve(size + 1);  // so that no memory is null, not even that of size 0
    memory_[i].resize(size);
    const auto* bytes = static_cast<const uint8_t*>(buffer);
    if (type != TEE_PARAM_TYPE_MEMREF_OUTPUT) std::copy_n(bytes, size, memory_[i].begin());
    callee_.slots[i].memref = {memory_[i].data(), size};
  }
}

void ta_parameters::copy_back(TEE_Param* callers) const {
  for (size_t i = 0; i < PARAM_COUNT; i++) {
    uint32_t type = TEE_PARAM_TYPE_GET(callee_.types, i);
    if (type == TEE_PARAM_TYPE_VALUE_OUTPUT || type == TEE_PARAM_TYPE_VALUE_INOUT) {
      callers[i].value = callee_.slots[i].value;
    }
    if (type != TEE_PARAM_TYPE_MEMREF_OUTPUT && type != TEE_PARAM_TYPE_MEMREF_INOUT) continue;
    size_t size = callee_.slots[i].memref.size;
    if (size <= memory_[i].size()) {
      std::copy_n(memory_[i].begin(), size, static_cast<uint8_t*>(callers[i].memref.buffer));
    }
    callers[i].memref.size = size;
  }
}

}  // namespace tee
