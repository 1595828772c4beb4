// What both ways to a TEE do with a client's operation: check it and name its memory, give results
// back, and find it again when it is to be cancelled.
#pragma once

#include "tee_client_api.h"
#include "tee_internal_api.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>

namespace tee {

constexpr size_t SLOTS = 4;

// parameter_type: TEE_PARAM_TYPE_ of a slot in a word of four. is_input, is_output: whether such a
// slot brings something, takes something back. is_memory: whether it is a memory reference.
constexpr uint32_t parameter_type(uint32_t types, size_t slot) {
  return types >> (4 * slot) & 0xF;
}
constexpr bool is_input(uint32_t type) {
  return (type & 1) != 0;
}
constexpr bool is_output(uint32_t type) {
  return (type & 2) != 0;
}
constexpr bool is_memory(uint32_t type) {
  return (type & 4) != 0;
}

// Shared memory: what an operation needs to know of it.
struct shared_region {
  const void* context;  // imp of its context
  uint8_t* buffer;
  size_t size;
  uint32_t flags;  // TEEC_MEM_
};

// check_memory: whether memory of that size and those directions can be shared; null cannot.
// TEEC_ERROR_BAD_PARAMETERS, TEEC_ERROR_OUT_OF_MEMORY above TEEC_CONFIG_SHAREDMEM_MAX_SIZE.
[[nodiscard]] TEEC_Result check_memory(const TEEC_SharedMemory* memory);

// An operation's parameters, checked. Memory is named and not copied: temporary or shared, it stays
// the client's own.
class operation_parameters {
 public:
  // A table of shared memory: what a number stands for, or null.
  using finder = std::shared_ptr<const shared_region> (*)(const void* imp);

  // take: translates the operation's types and parameters (null: none); unused slots and value
  // outputs are zero. TEEC_ERROR_BAD_PARAMETERS for unknown types, null buffers with a size, memory
  // that is not shared in `context`, ranges that leave it, directions that it does not allow.
  [[nodiscard]] TEEC_Result take(const void* context, const TEEC_Operation* operation, finder find);

  uint32_t types() const { return types_; }  // TEE_PARAM_TYPE_, 4 bits a slot
  const std::array<TEE_Param, SLOTS>& slots() const { return slots_; }

  // region: the shared memory that a slot lies in; null when it lies in none.
  const shared_region* region(size_t slot) const { return regions_[slot].get(); }

  // give_back: values and sizes of outputs, as a call left them in `slots`; a size may exceed the
  // capacity (what was needed).
  void give_back(const std::array<TEE_Param, SLOTS>& slots, TEEC_Operation* operation) const;

 private:
  TEEC_Result take_slot(const void* context, uint32_t type, const TEEC_Parameter& from, size_t slot,
                        finder find);
  TEEC_Result take_shared(const void* context, uint32_t type,
                          const TEEC_RegisteredMemoryReference& from, size_t slot, finder find);
  void set_slot(size_t slot, uint32_t type, void* buffer, size_t size);

  uint32_t types_ = 0;
  std::array<TEE_Param, SLOTS> slots_{};
  std::array<std::shared_ptr<const shared_region>, SLOTS> regions_;  // live as long as the call
};

// A call with an operation, while it lasts; null: a call that nobody can cancel. A client cancels
// by the operation's address, from another thread.
class operation_in_flight {
 public:
  // `request_end` is called, at most once at a time, while this lives.
  operation_in_flight(const TEEC_Operation* operation, std::function<void()> request_end);
  operation_in_flight(const operation_in_flight&) = delete;
  operation_in_flight& operator=(const operation_in_flight&) = delete;
  ~operation_in_flight();

  // cancel: requests the end of all calls with `operation`; none: no effect.
  static void cancel(const TEEC_Operation* operation);

 private:
  const TEEC_Operation* operation_;
  std::function<void()> request_end_;
  operation_in_flight* before_ = nullptr;  // the list of them all
  operation_in_flight* after_ = nullptr;
};

}  // namespace tee
