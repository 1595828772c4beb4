// A mapping of memory that two processes share.
#include "tee/wire/shared_mapping.h"

#include <new>
#include <sys/mman.h>
#include <utility>

#include "tee/wire/os_calls.h"

namespace tee::wire {

shared_mapping::shared_mapping(file_descriptor memory, size_t size) : memory_(std::move(memory)) {
  void* mapped = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, memory_.get(), 0);
  if (mapped == MAP_FAILED) throw std::bad_alloc();
  madvise(mapped, size, MADV_DONTDUMP);
  data_ = static_cast<uint8_t*>(mapped);
  size_ = size;
}

shared_mapping::shared_mapping(shared_mapping&& other) noexcept {
  *this = std::move(other);
}

shared_mapping& shared_mapping::operator=(shared_mapping&& other) noexcept {
  std::swap(memory_, other.memory_);
  std::swap(data_, other.data_);
  std::swap(size_, other.size_);
  return *this;
}

shared_mapping::~shared_mapping() {
  if (data_ != nullptr) munmap(data_, size_);
}

shared_mapping shared_mapping::make(size_t size) {
  file_descriptor memory(os::make_shared_memory(size));
  if (!memory) throw std::bad_alloc();
  return {std::move(memory), size};
}

}  // namespace tee::wire
