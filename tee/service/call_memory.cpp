// The parameters of a call that came as a message, and its way back.
#include "tee/service/call_memory.h"

#include <algorithm>
#include <cstring>

#include "tee/teec/operation.h"

namespace tee::service {

namespace {

bool is_known(uint32_t type) {
  return type <= TEE_PARAM_TYPE_MEMREF_INOUT && type != TEE_PARAM_TYPE_MEMREF_INPUT - 1;
}

constexpr uint32_t ALL_TYPES = 0xFFFF;

}  // namespace

bool call_memory::take(wire::reader& from, const shared_memories& shared,
                       std::span<uint8_t> packet) {
  packet_ = packet;
  const wire::call given = wire::read_call(from);
  if (!from.ok() || (given.types & ~ALL_TYPES) != 0) return false;
  parameters_.types = given.types;
  for (size_t i = 0; i < PARAM_COUNT; i++) {
    const uint32_t type = parameter_type(given.types, i);
    const wire::slot& slot = given.slots[i];
    if (!is_known(type)) return false;
    if (is_memory(type)) {
      if (!take_memory(from, shared, type, slot, i)) return false;
    } else if (is_input(type)) {
      parameters_.slots[i].value = {slot.a, slot.b};
    }
  }
  return from.ended();
}

bool call_memory::take_memory(wire::reader& from, const shared_memories& shared, uint32_t type,
                              const wire::slot& given, size_t slot) {
  switch (static_cast<wire::place>(given.a)) {
    case wire::place::NOWHERE:
      return given.b == 0;
    case wire::place::INLINE:
      return take_inline(from, type, given.b, slot);
    case wire::place::SHARED:
      mapped_[slot] = shared.find(given.c, given.d, given.b);
      if (!mapped_[slot]) return false;
      parameters_.slots[slot].memref = {mapped_[slot]->data() + given.d, given.b};
      return true;
  }
  return false;
}

bool call_memory::take_inline(wire::reader& from, uint32_t type, size_t size, size_t slot) {
  std::span<const uint8_t> given;
  if (is_input(type)) {
    given = from.bytes(size);
    from.pad();
    if (!from.ok()) return false;
  }
  if (!is_output(type)) {
    parameters_.slots[slot].memref = {const_cast<uint8_t*>(given.data()), size};
    return true;
  }
  if (size > packet_.size() - used_) return false;
  out_[slot] = packet_.subspan(used_, size);
  used_ += std::min(wire::padded(size), packet_.size() - used_);
  std::copy(given.begin(), given.end(), out_[slot].begin());
  parameters_.slots[slot].memref = {out_[slot].data(), size};
  return true;
}

size_t call_memory::write_back(wire::answer answer) const {
  size_t end = wire::ANSWER_HEADER;
  for (size_t i = 0; i < PARAM_COUNT; i++) {
    const uint32_t type = parameter_type(parameters_.types, i);
    if (!is_output(type)) continue;
    if (!is_memory(type)) {
      answer.slots[i] = {parameters_.slots[i].value.a, parameters_.slots[i].value.b};
      continue;
    }
    const uint64_t size = parameters_.slots[i].memref.size;
    answer.slots[i] = {static_cast<uint32_t>(size), static_cast<uint32_t>(size >> 32)};
    const auto kept = static_cast<size_t>(std::min<uint64_t>(size, out_[i].size()));
    if (kept == 0) continue;
    // Never to behind where it is: what comes before has shrunk at most.
    std::memmove(packet_.data() + end, out_[i].data(), kept);
    const size_t padding = std::min(wire::padded(kept), packet_.size() - end) - kept;
    std::fill_n(packet_.data() + end + kept, padding, 0);
    end += kept + padding;
  }
  wire::writer to(packet_);
  wire::write(to, answer);
  return end;
}

}  // namespace tee::service
