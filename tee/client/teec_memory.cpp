// TEE Client API 1.0: shared memory.
#include <algorithm>
#include <memory>
#include <utility>

#include "tee/client/in_process.h"
#include "tee/client/teec_state.h"

namespace tee::in_process {
namespace {

TEEC_Result check(const TEEC_Context* context, const TEEC_SharedMemory* memory) {
  if (context == nullptr || !contexts().find(context->imp)) return TEEC_ERROR_BAD_PARAMETERS;
  return check_memory(memory);
}

}  // namespace

TEEC_Result register_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory) {
  return client_call([&]() -> TEEC_Result {
    if (TEEC_Result res = check(context, memory)) return res;
    if (memory->buffer == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    auto* buffer = static_cast<uint8_t*>(memory->buffer);
    auto kept = std::make_shared<client_memory>(
        client_memory{{context->imp, buffer, memory->size, memory->flags}, {}});
    memory->imp = client_memories().add(std::move(kept));
    return TEEC_SUCCESS;
  });
}

TEEC_Result allocate_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory) {
  return client_call([&]() -> TEEC_Result {
    if (TEEC_Result res = check(context, memory)) return res;
    // At least one byte, so that the buffer is an address even when nothing fits in it.
    secret_bytes bytes(std::max<size_t>(memory->size, 1));
    uint8_t* buffer = bytes.data();
    auto kept = std::make_shared<client_memory>(
        client_memory{{context->imp, buffer, memory->size, memory->flags}, std::move(bytes)});
    memory->imp = client_memories().add(std::move(kept));
    memory->buffer = buffer;
    return TEEC_SUCCESS;
  });
}

void release_shared_memory(TEEC_SharedMemory* memory) {
  if (memory == nullptr) return;
  client_call([&]() -> TEEC_Result {
    auto kept = client_memories().take(memory->imp);
    memory->imp = nullptr;
    if (!kept || kept->own.empty()) return TEEC_SUCCESS;
    memory->buffer = nullptr;
    memory->size = 0;
    return TEEC_SUCCESS;
  });
}

}  // namespace tee::in_process
