// Where secrets lie: chunks of locked memory, cut into blocks whose sizes are powers of two.
#include "tee/device/secret_memory.h"

#include <array>
#include <atomic>
#include <bit>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <mutex>
#include <sys/mman.h>

#ifndef __has_feature
#define __has_feature(name) 0
#endif

namespace tee {

namespace {

// Under the address sanitizer secrets lie in its heap, which sees a byte too far.
#if defined(__SANITIZE_ADDRESS__) || __has_feature(address_sanitizer)
constexpr bool SANITIZED = true;
#else
constexpr bool SANITIZED = false;
#endif

constexpr size_t CHUNK_SIZE = size_t{256} * 1024;
constexpr size_t SMALLEST = 16;  // also their alignment
constexpr size_t LARGEST = size_t{32} * 1024;
constexpr size_t CLASSES = std::bit_width(LARGEST / SMALLEST);

std::atomic<int> lock_failure{0};
std::atomic<bool> failure_taken{false};

// A mapping that is left out of core dumps; null when there is no memory.
void* map(size_t size) {
  void* mapping = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (mapping == MAP_FAILED) return nullptr;
  madvise(mapping, size, MADV_DONTDUMP);
  return mapping;
}

class arena {
 public:
  void* allocate(size_t class_index) {
    std::lock_guard lock(mutex_);
    if (free_block* block = free_[class_index]) {
      free_[class_index] = block->next;
      return block;
    }
    const size_t size = SMALLEST << class_index;
    if (left_ < size && !add_chunk()) return nullptr;
    uint8_t* block = rest_;
    rest_ += size;
    left_ -= size;
    return block;
  }

  void release(void* block, size_t class_index) {
    std::lock_guard lock(mutex_);
    free_[class_index] = new (block) free_block{free_[class_index]};
  }

 private:
  struct free_block {
    free_block* next;
  };

  // What is left of the chunk before is not cut any more: at most one block of the largest size.
  bool add_chunk() {
    void* chunk = map(CHUNK_SIZE);
    if (chunk == nullptr) return false;
    if (mlock(chunk, CHUNK_SIZE) != 0) lock_failure = errno;
    rest_ = static_cast<uint8_t*>(chunk);
    left_ = CHUNK_SIZE;
    return true;
  }

  std::mutex mutex_;
  uint8_t* rest_ = nullptr;
  size_t left_ = 0;
  std::array<free_block*, CLASSES> free_{};
};

// Never destroyed: what holds secrets may end as late as it likes.
arena& secrets() {
  static arena& instance = *new arena;
  return instance;
}

size_t class_of(size_t size) {
  return size <= SMALLEST ? 0 : static_cast<size_t>(std::bit_width((size - 1) / SMALLEST));
}

}  // namespace

void* allocate_secret(size_t size) noexcept {
  if (SANITIZED) return std::malloc(size);
  return size > LARGEST ? map(size) : secrets().allocate(class_of(size));
}

void release_secret(void* block, size_t size) noexcept {
  if (SANITIZED) {
    std::free(block);
  } else if (size > LARGEST) {
    munmap(block, size);
  } else {
    secrets().release(block, class_of(size));
  }
}

int take_lock_failure() noexcept {
  const int failure = lock_failure;
  return failure == 0 || failure_taken.exchange(true) ? 0 : failure;
}

}  // namespace tee
