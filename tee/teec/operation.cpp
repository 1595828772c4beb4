// What both ways to a TEE do with a client's operation.
#include "tee/teec/operation.h"

#include <mutex>
#include <utility>

namespace tee {

namespace {

constexpr uint32_t ALL_TYPE_BITS = 0xFFFF;

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

TEEC_Result check_memory(const TEEC_SharedMemory* memory) {
  constexpr uint32_t ALL_DIRECTIONS = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;
  if (memory == nullptr || memory->flags == 0 || (memory->flags & ~ALL_DIRECTIONS) != 0) {
    return TEEC_ERROR_BAD_PARAMETERS;
  }
  return memory->size <= TEEC_CONFIG_SHAREDMEM_MAX_SIZE ? TEEC_SUCCESS : TEEC_ERROR_OUT_OF_MEMORY;
}

TEEC_Result operation_parameters::take(const void* context, const TEEC_Operation* operation,
                                       finder find) {
  if (operation == nullptr) return TEEC_SUCCESS;
  const uint32_t types = operation->paramTypes;
  if ((types & ~ALL_TYPE_BITS) != 0) return TEEC_ERROR_BAD_PARAMETERS;
  for (size_t slot = 0; slot < SLOTS; slot++) {
    TEEC_Result res =
        take_slot(context, parameter_type(types, slot), operation->params[slot], slot, find);
    if (res != TEEC_SUCCESS) return res;
  }
  return TEEC_SUCCESS;
}

TEEC_Result operation_parameters::take_slot(const void* context, uint32_t type,
                                            const TEEC_Parameter& from, size_t slot, finder find) {
  switch (type) {
    case TEEC_NONE:
      return TEEC_SUCCESS;
    case TEEC_VALUE_INPUT:
    case TEEC_VALUE_INOUT:
      slots_[slot].value = {from.value.a, from.value.b};
      [[fallthrough]];
    case TEEC_VALUE_OUTPUT:
      types_ |= type << (4 * slot);
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
      return take_shared(context, type, from.memref, slot, find);
    default:
      return TEEC_ERROR_BAD_PARAMETERS;
  }
}

TEEC_Result operation_parameters::take_shared(const void* context, uint32_t type,
                                              const TEEC_RegisteredMemoryReference& from,
                                              size_t slot, finder find) {
  if (from.parent == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  auto memory = find(from.parent->imp);
  if (!memory || memory->context != context) return TEEC_ERROR_BAD_PARAMETERS;
  if (type == TEEC_MEMREF_WHOLE) {
    set_slot(slot, memref_type(memory->flags), memory->buffer, memory->size);
  } else {
    uint32_t directions = directions_of(type);
    bool inside = from.offset <= memory->size && from.size <= memory->size - from.offset;
    if (!inside || (directions & ~memory->flags) != 0) return TEEC_ERROR_BAD_PARAMETERS;
    set_slot(slot, memref_type(directions), memory->buffer + from.offset, from.size);
  }
  regions_[slot] = std::move(memory);
  return TEEC_SUCCESS;
}

void operation_parameters::set_slot(size_t slot, uint32_t type, void* buffer, size_t size) {
  types_ |= type << (4 * slot);
  slots_[slot].memref = {buffer, size};
}

void operation_parameters::give_back(const std::array<TEE_Param, SLOTS>& slots,
                                     TEEC_Operation* operation) const {
  for (size_t slot = 0; slot < SLOTS; slot++) {
    const uint32_t type = parameter_type(types_, slot);
    if (!is_output(type)) continue;
    TEEC_Parameter& to = operation->params[slot];
    if (!is_memory(type)) {
      to.value = {slots[slot].value.a, slots[slot].value.b};
    } else if (regions_[slot]) {
      to.memref.size = slots[slot].memref.size;
    } else {
      to.tmpref.size = slots[slot].memref.size;
    }
  }
}

namespace {

// Calls in flight are few: a list of them, chained through themselves, takes no memory.
std::mutex flights_mutex;
operation_in_flight* last_flight = nullptr;

}  // namespace

operation_in_flight::operation_in_flight(const TEEC_Operation* operation,
                                         std::function<void()> request_end)
    : operation_(operation), request_end_(std::move(request_end)) {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights_mutex);
  before_ = last_flight;
  if (before_ != nullptr) before_->after_ = this;
  last_flight = this;
}

operation_in_flight::~operation_in_flight() {
  if (operation_ == nullptr) return;
  std::lock_guard lock(flights_mutex);
  if (before_ != nullptr) before_->after_ = after_;
  (after_ != nullptr ? after_->before_ : last_flight) = before_;
}

void operation_in_flight::cancel(const TEEC_Operation* operation) {
  std::lock_guard lock(flights_mutex);
  for (operation_in_flight* call = last_flight; call != nullptr; call = call->before_) {
    if (call->operation_ == operation) call->request_end_();
  }
}

}  // namespace tee
