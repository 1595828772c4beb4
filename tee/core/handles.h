// Handles: what a trusted application holds in place of objects, operations and sessions. A handle
// is a number below 2^31, so that it survives a 32-bit variable; a stale, foreign or made-up one
// panics.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "tee/core/panic.h"

namespace tee {

struct object;
struct operation;
class session;

// What is published of a kind of handle: its type, its name in messages, and the two bits that tell
// the kinds apart within a handle.
template <typename T>
struct handle_traits;
template <>
struct handle_traits<object> {
  using type = TEE_ObjectHandle;
  static constexpr const char* NAME = "object";
  static constexpr uint32_t KIND = 1;
};
template <>
struct handle_traits<operation> {
  using type = TEE_OperationHandle;
  static constexpr const char* NAME = "operation";
  static constexpr uint32_t KIND = 2;
};
template <>
struct handle_traits<std::shared_ptr<session>> {
  using type = TEE_TASessionHandle;
  static constexpr const char* NAME = "session";
  static constexpr uint32_t KIND = 3;
};

// next_handle_generation: 1 to 2^19 - 1, counted over all tables of the process, so that a handle
// of another instance does not fit here.
uint32_t next_handle_generation();

// A table of one instance. Handle: kind (2 bits, from bit 29), generation (19), slot (10). Not
// thread-safe: an instance runs one entry point at a time.
template <typename T>
class handle_table {
 public:
  using traits = handle_traits<T>;
  using handle = typename traits::type;
  static constexpr uint32_t SLOTS = 1024;

  // emplace: makes a value of the arguments, in a place that it keeps; null when the table is full.
  template <typename... Arguments>
  handle emplace(Arguments&&... arguments) {
    if (free_.empty() && !grow()) return nullptr;
    slot_record& place = *slots_[free_.back()];
    place.value.emplace(std::forward<Arguments>(arguments)...);
    place.number = handle_number(free_.back());
    free_.pop_back();
    return to_handle(place);
  }

  // find: what the handle stands for; null when it is not a live handle of this table.
  T* find(handle value) const {
    const size_t slot = slot_of(value);
    if (slot >= slots_.size()) return nullptr;
    slot_record& place = *slots_[slot];
    return place.value && to_handle(place) == value ? &*place.value : nullptr;
  }

  // get: likewise; panics in the name of `call` when it is not a live handle of this table.
  T& get(handle value, const char* call) const {
    T* found = find(value);
    if (!found) panic(call, "%s handle %p is not valid", traits::NAME, static_cast<void*>(value));
    return *found;
  }

  // remove: ends the value and its handle; panics like get.
  void remove(handle value, const char* call) {
    get(value, call);
    slots_[slot_of(value)]->value.reset();
    free_.push_back(static_cast<uint32_t>(slot_of(value)));
  }

  // clear: ends all values and their handles.
  void clear() {
    for (uint32_t slot = 0; slot < slots_.size(); slot++) {
      if (!slots_[slot]->value) continue;
      slots_[slot]->value.reset();
      free_.push_back(slot);
    }
  }

  size_t size() const { return slots_.size() - free_.size(); }

  // for_each: visit(handle, T&) for every live handle.
  template <typename Visit>
  void for_each(Visit&& visit) const {
    for (const auto& place : slots_) {
      if (place->value) visit(to_handle(*place), *place->value);
    }
  }

 private:
  struct slot_record {
    uint32_t number = 0;  // of the value's handle
    std::optional<T> value;
  };

  // Adds a free slot, unless the table is full.
  bool grow() {
    if (slots_.size() == SLOTS) return false;
    free_.reserve(slots_.size() + 1);  // so that remove() needs no memory
    slots_.push_back(std::make_unique<slot_record>());
    free_.push_back(static_cast<uint32_t>(slots_.size() - 1));
    return true;
  }

  // A handle that no value has had, or none for long.
  static uint32_t handle_number(uint32_t slot) {
    return traits::KIND << 29 | next_handle_generation() << 10 | slot;
  }
  static handle to_handle(const slot_record& place) {
    return reinterpret_cast<handle>(uintptr_t{place.number});
  }
  static size_t slot_of(handle value) { return reinterpret_cast<uintptr_t>(value) & (SLOTS - 1); }

  std::vector<std::unique_ptr<slot_record>> slots_;  // values stay in place while the table grows
  std::vector<uint32_t> free_;
};

}  // namespace tee
