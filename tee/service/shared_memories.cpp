// The memory that a client shares with the service.
#include "tee/service/shared_memories.h"

#include <utility>

#include "tee/wire/os_calls.h"

namespace tee::service {

uint32_t shared_memories::add(file_descriptor memory, size_t size) {
  if (size == 0 || size > SIZE_MAX_EACH || !os::is_fixed_memory(memory.get(), size)) return 0;
  auto mapping = std::make_shared<wire::shared_mapping>(std::move(memory), size);
  mapping->close_descriptor();
  std::lock_guard lock(mutex_);
  if (mappings_.size() >= COUNT_MAX || size > SIZE_MAX_ALL - total_) return 0;
  if (++last_ == 0) ++last_;
  if (!mappings_.emplace(last_, std::move(mapping)).second) return 0;
  total_ += size;
  return last_;
}

void shared_memories::remove(uint32_t number) {
  std::lock_guard lock(mutex_);
  auto node = mappings_.extract(number);
  if (!node.empty()) total_ -= node.mapped()->size();
}

std::shared_ptr<wire::shared_mapping> shared_memories::find(uint32_t number, size_t offset,
                                                            size_t size) const {
  std::lock_guard lock(mutex_);
  auto found = mappings_.find(number);
  if (found == mappings_.end()) return nullptr;
  const size_t all = found->second->size();
  return offset <= all && size <= all - offset ? found->second : nullptr;
}

}  // namespace tee::service
