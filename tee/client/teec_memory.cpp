// TEE Client API 1.0: shared memory.
#include "tee_client_api.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "tee/client/teec_state.h"

namespace tee {

namespace {

constexpr uint32_t ALL_DIRECTIONS = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;

TEEC_Result check(const TEEC_Context* context, const TEEC_SharedMemory* memory) {
  if (context == nullptr || memory == nullptr || !contexts().find(context->imp)) {
    return TEEC_ERROR_BAD_PARAMETERS;
  }
  if (memory->flags == 0 || (memory->flags & ~ALL_DIRECTIONS) != 0)
    return TEEC_ERROR_BAD_PARAMETERS;
  return memory->size <= TEEC_CONFIG_SHAREDMEM_MAX_SIZE ? TEEC_SUCCESS : TEEC_ERROR_OUT_OF_MEMORY;
}

}  // namespace
}  // namespace tee

using tee::client_call;
using tee::client_memory;
using tee::secret_bytes;

TEEC_Result TEEC_RegisterSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  return client_call([&]() -> TEEC_Result {
    if (TEEC_Result res = tee::check(context, sharedMem)) return res;
    if (sharedMem->buffer == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
    auto* buffer = static_cast<uint8_t*>(sharedMem->buffer);
    auto memory = std::make_shared<client_memory>(
        client_memory{context->imp, {}, buffer, sharedMem->size, sharedMem->flags});
    sharedMem->imp = tee::client_memories().add(std::move(memory));
    return TEEC_SUCCESS;
  });
}

TEEC_Result TEEC_AllocateSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  return client_call([&]() -> TEEC_Result {
    if (TEEC_Result res = tee::check(context, sharedMem)) return res;
    // At least one byte, so that the buffer is an address even when nothing fits in it.
    secret_bytes bytes(std::max<size_t>(sharedMem->size, 1));
    uint8_t* buffer = bytes.data();
    auto memory = std::make_shared<client_memory>(
        client_memory{context->imp, std::move(bytes), buffer, sharedMem->size, sharedMem->flags});
    sharedMem->imp = tee::client_memories().add(std::move(memory));
    sharedMem->buffer = buffer;
    return TEEC_SUCCESS;
  });
}

void TEEC_ReleaseSharedMemory(TEEC_SharedMemory* sharedMemory) {
  if (sharedMemory == nullptr) return;
  client_call([&]() -> TEEC_Result {
    auto memory = tee::client_memories().take(sharedMemory->imp);
    sharedMemory->imp = nullptr;
    if (!memory || memory->own.empty()) return TEEC_SUCCESS;
    sharedMemory->buffer = nullptr;
    sharedMemory->size = 0;
    return TEEC_SUCCESS;
  });
}
