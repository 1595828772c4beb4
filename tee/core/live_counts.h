// What a trusted application holds at the moment.
#pragma once

#include <cstddef>

namespace tee {

struct live_counts {
  size_t heap_bytes = 0;
  size_t heap_blocks = 0;
  size_t objects = 0;
  size_t operations = 0;
  size_t sessions = 0;
  bool operator==(const live_counts&) const = default;
};

}  // namespace tee
