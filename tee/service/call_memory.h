// The parameters of a call that came as a message, and its way back.
#pragma once

#include <array>
#include <memory>
#include <span>

#include "tee/core/session.h"
#include "tee/service/shared_memories.h"
#include "tee/wire/records.h"

namespace tee::service {

// Inputs in the message lie in the message that was received, outputs where the answer is made:
// both are the service's own. Shared memory is used in place.
class call_memory {
 public:
  // take: what `from` holds, to its end; false when it is not a call. `packet` is where the answer
  // goes; its bytes after the header must be zeros.
  [[nodiscard]] bool take(wire::reader& from, const shared_memories& shared,
                          std::span<uint8_t> packet);

  call_parameters& parameters() { return parameters_; }

  // used: how much of the packet can have been written to.
  size_t used() const { return used_; }

  // write_back: the answer with the outputs, at the start of the packet that take was given; its
  // length.
  size_t write_back(wire::answer answer) const;

 private:
  [[nodiscard]] bool take_memory(wire::reader& from, const shared_memories& shared, uint32_t type,
                                 const wire::slot& given, size_t slot);
  [[nodiscard]] bool take_inline(wire::reader& from, uint32_t type, size_t size, size_t slot);

  call_parameters parameters_;
  std::span<uint8_t> packet_;
  size_t used_ = wire::ANSWER_HEADER;                // of the packet
  std::array<std::span<uint8_t>, PARAM_COUNT> out_;  // outputs in the packet
  std::array<std::shared_ptr<wire::shared_mapping>, PARAM_COUNT> mapped_;
};

}  // namespace tee::service
