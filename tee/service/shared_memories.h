// The memory that a client shares with the service.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>

#include "tee/wire/shared_mapping.h"

namespace tee::service {

// Safe to use from any thread. A call that uses memory keeps it mapped.
class shared_memories {
 public:
  static constexpr size_t COUNT_MAX = 256;
  static constexpr size_t SIZE_MAX_EACH = size_t{512} << 20;
  static constexpr size_t SIZE_MAX_ALL = size_t{2} << 30;

  // add: maps it; its number, or 0 when it is no memory of fixed size or is beyond the bounds.
  // Throws std::bad_alloc.
  uint32_t add(file_descriptor memory, size_t size);
  void remove(uint32_t number);

  // find: null when the range does not lie in the memory of that number.
  std::shared_ptr<wire::shared_mapping> find(uint32_t number, size_t offset, size_t size) const;

 private:
  mutable std::mutex mutex_;
  std::map<uint32_t, std::shared_ptr<wire::shared_mapping>> mappings_;
  size_t total_ = 0;
  uint32_t last_ = 0;
};

}  // namespace tee::service
