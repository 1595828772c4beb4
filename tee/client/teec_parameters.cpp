// Parameters on their way from the normal world to a trusted application.
#include "tee/client/teec_parameters.h"

namespace tee {

namespace {

constexpr uint32_t ALL_TYPE_BITS = 0xFFFF;

uint32_t type_of(uint32_t types, size_t slot) {
  return types >> (4 * slot) & 0xF;
}

constexpr bool is_output(uint32_t tee_type) {
  return tee_type == TEE_PARAM_TYPE_VALUE_OUTPUT || tee_type == TEE_PARAM_TYPE_VALUE_INOUT ||
         tee_type == TEE_PARAM_TYPE_MEMREF_OUTPUT || tee_type == TEE_PARAM_TYPE_MEMREF_INOUT;
}

// The directions of memory as the low bits of a memory reference's type tell them: 1 in, 2 out, the
// same bits as TEEC_MEM_INPUT and TEEC_MEM_OUTPUT.
constexpr uint32_t directions_of(uint32_t type) {
  return type & 3;
}
constexpr uint32_t memref_type(uint32_t directions) {
  return 4 | directions;
}

static_assert(memref_type(TEEC_MEM_INPUT) == TEE_PARAM_TYPE_MEMREF_INPUT);
static_assert(memref_type(TEEC_MEM_OUTPUT) == TEE_PARAM_TYPE_MEMREF_OUTPUT);
static_assert(memref_type(TEEC_MEM_INPUT | TEEC_MEM_OUTPUT) == TEE_PARAM_TYPE_MEMREF_INOUT);
static_assert(directions_of(TEEC_MEMREF_PARTIAL_OUTPUT) == TEEC_MEM_OUTPUT);

}  // namespace

TEEC_Result teec_parameters::take(const void* context, const TEEC_Operation* operation) {
  if (operation == nullptr) return TEEC_SUCCESS;
  const uint32_t types = operation->paramTypes;
  if ((types & ~ALL_TYPE_BITS) != 0) return TEEC_ERROR_BAD_PARAMETERS;
  for (size_t slot = 0; slot < PARAM_COUNT; slot++) {
    TEEC_Result res = take_slot(context, type_of(types, slot), operation->params[slot], slot);
    if (res != TEEC_SUCCESS) return res;
  }
  return TEEC_SUCCESS;
}

TEEC_Result teec_parameters::take_slot(const void* context, uint32_t type,
                                       const TEEC_Parameter& from, size_t slot) {
  switch (type) {
    case TEEC_NONE:
      return TEEC_SUCCESS;
    case TEEC_VALUE_INPUT:
    case TEEC_VALUE_INOUT:
      callee_.slots[slot].value = {from.value.a, from.value.b};
      [[fallthrough]];
    case TEEC_VALUE_OUTPUT:
      callee_.types |= type << (4 * slot);
      return TEEC_SUCCESS;
    case TEEC_MEMREF_TEMP_INPUT:
    case TEEC_MEMREF_TEMP_OUTPUT:
    case TEEC_MEMREF_TEMP_INOUT:
      if (from.tmpref.buffer == nullptr && from.tmpref.size != 0) return TEEC_ERROR_BAD_PARAMETERS;
      set_slot(slot, type, from.tmpref.buffer, from.tmpref.size);
      return TEEC_SUCCESS;
    case TEEC_MEMREF_WHOLE:
    case TEEC_MEMREF_PARTIAL_INPUT:
    case TEEC_MEMREF_PARTIAL_OUTPUT:
    case TEEC_MEMREF_PARTIAL_INOUT:
      return take_registered(context, type, from.memref, slot);
    default:
      return TEEC_ERROR_BAD_PARAMETERS;
  }
}

TEEC_Result teec_parameters::take_registered(const void* context, uint32_t type,
                                             const TEEC_RegisteredMemoryReference& from,
                                             size_t slot) {
  if (from.parent == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  auto memory = client_memories().find(from.parent->imp);
  if (!memory || memory->context != context) return TEEC_ERROR_BAD_PARAMETERS;
  if (type == TEEC_MEMREF_WHOLE) {
    set_slot(slot, memref_type(memory->flags), memory->buffer, memory->size);
  } else {
    uint32_t directions = directions_of(type);
    bool inside = from.offset <= memory->size && from.size <= memory->size - from.offset;
    if (!inside || (directions & ~memory->flags) != 0) return TEEC_ERROR_BAD_PARAMETERS;
    set_slot(slot, memref_type(directions), memory->buffer + from.offset, from.size);
  }
  memory_[slot] = std::move(memory);
  return TEEC_SUCCESS;
}

void teec_parameters::set_slot(size_t slot, uint32_t type, void* buffer, size_t size) {
  callee_.types |= type << (4 * slot);
  callee_.slots[slot].memref = {buffer, size};
}

void teec_parameters::give_back(TEEC_Operation* operation) const {
  for (size_t slot = 0; slot < PARAM_COUNT; slot++) {
    uint32_t type = type_of(callee_.types, slot);
    if (!is_output(type)) continue;
    TEEC_Parameter& to = operation->params[slot];
    if (type == TEE_PARAM_TYPE_VALUE_OUTPUT || type == TEE_PARAM_TYPE_VALUE_INOUT) {
      to.value = {callee_.slots[slot].value.a, callee_.slots[slot].value.b};
    } else if (memory_[slot]) {
      to.memref.size = callee_.slots[slot].memref.size;
    } else {
      to.tmpref.size = callee_.slots[slot].memref.size;
    }
  }
}

}  // namespace tee
