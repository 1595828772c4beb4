// One call with an operation, over the wire. Small memory goes along in the packets. What does not
// fit goes through an area that the connection shares with the server, and memory that the client
// allocated here is there already.
#include "tee/remote/remote_call.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <utility>

namespace tee::remote {

namespace {

constexpr size_t AREA_LEAST = size_t{1} << 20;  // so that it seldom grows
constexpr size_t AREA_ALIGNMENT = 64;

constexpr remote_result GONE = {TEEC_ERROR_TARGET_DEAD, TEEC_ORIGIN_COMMS, 0};

size_t in_area(size_t size) {
  return (size + AREA_ALIGNMENT - 1) & ~(AREA_ALIGNMENT - 1);
}

// Where the parameters of one call are on their way.
class passage {
 public:
  passage(const operation_parameters& given, const link& tie, connection& over)
      : given_(given), tie_(tie), over_(over) {
    for (size_t i = 0; i < SLOTS; i++)
      total_ += goes_along(i) ? in_area(given_.slots()[i].memref.size) : 0;
    inline_ = total_ <= wire::INLINE_MAX - SLOTS * AREA_ALIGNMENT;
  }

  bool needs_area() const { return !inline_ && total_ > over_.area.size(); }
  size_t total() const { return total_; }

  void write_to(wire::writer& to) {
    wire::call call;
    call.types = given_.types();
    size_t at = 0;
    for (size_t i = 0; i < SLOTS; i++) {
      call.slots[i] = describe(i, at);
      if (goes_along(i) && !inline_) at += in_area(given_.slots()[i].memref.size);
    }
    wire::write(to, call);
    for (size_t i = 0; i < SLOTS; i++) {
      if (!goes_along(i) || !inline_ || !is_input(type(i))) continue;
      to.bytes(bytes(i));
      to.pad();
    }
    offsets_ = call;
  }

  // Outputs back to the client's memory; false when the answer does not hold what it says.
  [[nodiscard]] bool read_from(wire::reader& from, const wire::answer& answer,
                               TEEC_Operation* operation) const {
    auto slots = given_.slots();
    for (size_t i = 0; i < SLOTS; i++) {
      if (!is_output(type(i))) continue;
      if (!is_memory(type(i))) {
        slots[i].value = {answer.slots[i].a, answer.slots[i].b};
        continue;
      }
      const uint64_t size = uint64_t{answer.slots[i].b} << 32 | answer.slots[i].a;
      const auto kept = static_cast<size_t>(std::min<uint64_t>(size, slots[i].memref.size));
      slots[i].memref.size = static_cast<size_t>(std::min<uint64_t>(size, SIZE_MAX));
      if (!goes_along(i) || kept == 0) continue;
      const uint8_t* source = nullptr;
      if (inline_) {
        source = from.bytes(kept).data();
        from.pad();
      } else {
        source = over_.area.data() + offsets_.slots[i].d;
      }
      if (!from.ok()) return false;
      std::memcpy(slots[i].memref.buffer, source, kept);
    }
    if (operation != nullptr) given_.give_back(slots, operation);
    return from.ok();
  }

 private:
  uint32_t type(size_t i) const { return parameter_type(given_.types(), i); }

  // Null also for memory of a server that went away, which is the client's alone now.
  const remote_memory* own_memory(size_t i) const {
    const auto* memory = static_cast<const remote_memory*>(given_.region(i));
    return memory != nullptr && memory->tie.get() == &tie_ ? memory : nullptr;
  }

  // Whether its bytes are neither absent nor shared already.
  bool goes_along(size_t i) const {
    return is_memory(type(i)) && given_.slots()[i].memref.buffer != nullptr && !own_memory(i);
  }

  std::span<const uint8_t> bytes(size_t i) const {
    const auto& memory = given_.slots()[i].memref;
    return {static_cast<const uint8_t*>(memory.buffer), memory.size};
  }

  wire::slot describe(size_t i, size_t at) const {
    if (!is_memory(type(i))) return {given_.slots()[i].value.a, given_.slots()[i].value.b, 0, 0};
    const auto size = static_cast<uint32_t>(bytes(i).size());
    if (const remote_memory* memory = own_memory(i)) {
      const auto offset = static_cast<uint32_t>(bytes(i).data() - memory->buffer);
      return {static_cast<uint32_t>(wire::place::SHARED), size, memory->number, offset};
    }
    if (!goes_along(i)) return {static_cast<uint32_t>(wire::place::NOWHERE), 0, 0, 0};
    if (inline_) return {static_cast<uint32_t>(wire::place::INLINE), size, 0, 0};
    if (is_input(type(i))) std::memcpy(over_.area.data() + at, bytes(i).data(), size);
    return {static_cast<uint32_t>(wire::place::SHARED), size, over_.area_number,
            static_cast<uint32_t>(at)};
  }

  const operation_parameters& given_;
  const link& tie_;
  connection& over_;
  size_t total_ = 0;
  bool inline_ = true;
  wire::call offsets_;
};

// A larger area in place of the connection's; false when the server is gone.
bool enlarge(connection& over, size_t size, TEEC_Result* result) {
  wire::answer answer;
  wire::shared_mapping made = wire::shared_mapping::make(std::bit_ceil(std::max(size, AREA_LEAST)));
  wire::writer to(over.packet);
  to.u32(static_cast<uint32_t>(wire::request::SHARE));
  to.u32(static_cast<uint32_t>(made.size()));
  to.u32(over.area_number);
  const size_t length = exchange(over, to.length(), made.descriptor());
  wire::reader from(std::span(over.packet).first(length));
  answer = wire::read_answer(from);
  *result = answer.result;
  if (!from.ok() || answer.result != TEEC_SUCCESS) return from.ok();
  over.area = std::move(made);
  over.area_number = answer.number;
  return true;
}

}  // namespace

bool share(link& tie, const wire::shared_mapping& memory, uint32_t* number, TEEC_Result* result) {
  wire::answer answer;
  const bool there = tie.ask(
      [&](wire::writer& to) {
        to.u32(static_cast<uint32_t>(wire::request::SHARE));
        to.u32(static_cast<uint32_t>(memory.size()));
        to.u32(0);
      },
      &answer, memory.descriptor());
  *number = answer.number;
  *result = answer.result;
  return there;
}

namespace {

// Over a connection of its own; `failed`: whether the server is gone.
remote_result call_over(link& tie, connection& over, const operation_parameters& given,
                        TEEC_Operation* operation,
                        const std::function<void(wire::writer&, uint32_t call)>& begin,
                        bool* failed) {
  passage way(given, tie, over);
  if (way.total() > TEEC_CONFIG_SHAREDMEM_MAX_SIZE) {
    return {TEEC_ERROR_OUT_OF_MEMORY, TEEC_ORIGIN_API, 0};
  }
  TEEC_Result shared = TEEC_SUCCESS;
  *failed = way.needs_area() && !enlarge(over, way.total(), &shared);
  if (*failed) return GONE;
  if (shared != TEEC_SUCCESS) return {shared, TEEC_ORIGIN_COMMS, 0};

  const uint32_t number = ++over.last_call;
  wire::writer to(over.packet);
  begin(to, number);
  way.write_to(to);
  const operation_in_flight flight(operation,
                                   [&tie, &over, number] { tie.cancel(over.number, number); });
  const size_t length = to.ok() ? exchange(over, to.length()) : 0;
  wire::reader from(std::span(over.packet).first(length));
  const wire::answer answer = wire::read_answer(from);
  *failed = !from.ok();
  if (!*failed && answer.origin == TEEC_ORIGIN_TRUSTED_APP) {
    *failed = !way.read_from(from, answer, operation);
  }
  over.wipe(length);
  return *failed ? GONE : remote_result{answer.result, answer.origin, answer.number};
}

}  // namespace

remote_result run_call(link& tie, const operation_parameters& given, TEEC_Operation* operation,
                       const std::function<void(wire::writer&, uint32_t call)>& begin) {
  if (!tie.at_home()) return {TEEC_ERROR_BAD_STATE, TEEC_ORIGIN_COMMS, 0};
  auto over = tie.take();
  if (!over) return GONE;
  bool failed = true;
  const remote_result result = call_over(tie, *over, given, operation, begin, &failed);
  tie.give_back(std::move(over), failed);
  return result;
}

}  // namespace tee::remote
