// The operation pool.
#include "ta/auth/operation_pool.h"

namespace keymaster {
namespace {

constexpr size_t POOL_SIZE = 16;

// A free slot keeps the handle it had: an ended operation's handle is not drawn again until the
// slot is reused, so that a client that still holds it does not meet another client's operation.
struct pool_slot_t {
  operation_t* operation;
  uint32_t handle;
  bool is_free;
};

pool_slot_t slots[POOL_SIZE];

bool is_remembered(uint32_t handle) {
  for (const pool_slot_t& slot : slots) {
    if (slot.handle == handle) return true;
  }
  return false;
}

uint32_t draw_handle() {
  uint32_t handle = 0;
  do {
    TEE_GenerateRandom(&handle, sizeof(handle));
  } while (handle == 0 || is_remembered(handle));
  return handle;
}

pool_slot_t* find_free_slot() {
  for (pool_slot_t& slot : slots) {
    if (slot.is_free) return &slot;
  }
  return nullptr;
}

pool_slot_t* find_live_slot(uint32_t handle) {
  for (pool_slot_t& slot : slots) {
    if (!slot.is_free && slot.handle == handle) return &slot;
  }
  return nullptr;
}

}  // namespace

void operation_pool_init() {
  for (pool_slot_t& slot : slots)
    slot = {.operation = nullptr, .handle = 0, .is_free = true};
}

keymaster_error_t operation_pool_add(operation_t* operation, uint32_t* handle) {
  const trace_scope scope;
  *handle = 0;
  pool_slot_t* slot = find_free_slot();
  if (slot == nullptr) return refuse(KM_ERROR_TOO_MANY_OPERATIONS, "Too many operations");
  *slot = {.operation = operation, .handle = draw_handle(), .is_free = false};
  *handle = slot->handle;
  return KM_ERROR_OK;
}

void operation_pool_remove(uint32_t handle) {
  const trace_scope scope;
  pool_slot_t* slot = find_live_slot(handle);
  if (slot == nullptr) {
    trace(TEE_TRACE_ERROR, "Try to free invalid operation handle");
    return;
  }
  slot->operation = nullptr;
  slot->is_free = true;
}

operation_t* operation_pool_get(uint32_t handle) {
  const trace_scope scope;
  const pool_slot_t* slot = find_live_slot(handle);
  if (slot == nullptr) {
    trace(TEE_TRACE_ERROR, "Operation handle not found");
    return nullptr;
  }
  return slot->operation;
}

}  // namespace keymaster
