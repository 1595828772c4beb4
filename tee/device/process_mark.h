// Tells a process from one that was forked from it, without a system call.
#pragma once

#include <cstdint>

namespace tee {

// process_mark: remembers the process that it was made in. A copy of it in a forked process,
// however that was forked, is not at home there.
class process_mark {
 public:
  process_mark();
  [[nodiscard]] bool at_home() const;

 private:
  uint64_t made_in_;
};

}  // namespace tee
