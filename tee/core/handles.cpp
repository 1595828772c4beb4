// Numbering of handles.
#include "tee/core/handles.h"

#include <atomic>

namespace tee {

uint32_t next_handle_generation() {
  constexpr uint32_t GENERATIONS = (1U << 19) - 1;  // 0 is no generation
  static std::atomic<uint32_t> issued{0};
  return issued.fetch_add(1, std::memory_order_relaxed) % GENERATIONS + 1;
}

}  // namespace tee
