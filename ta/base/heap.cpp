// The TA's heap.
#include "ta/base/heap.h"

namespace keymaster {

// The one place where memory is cleared: not every platform fills it, whatever the hint. The hint
// is the one that all of them know.
void* heap_take(size_t size) {
  const auto wanted = static_cast<tee_size>(size == 0 ? 1 : size);
  if (wanted < size) return nullptr;  // the platform's lengths have 32 bits
  void* block = TEE_Malloc(wanted, TEE_MALLOC_FILL_ZERO);
  if (block != nullptr) wipe({static_cast<uint8_t*>(block), wanted});
  return block;
}

void heap_give_back(void* block, size_t size) {
  if (block == nullptr) return;
  wipe({static_cast<uint8_t*>(block), size});
  TEE_Free(block);
}

void* heap_grow(void* block, size_t old_size, size_t new_size) {
  void* grown = heap_take(new_size);
  if (grown == nullptr) return nullptr;
  copy_bytes({static_cast<uint8_t*>(grown), new_size}, {static_cast<uint8_t*>(block), old_size});
  heap_give_back(block, old_size);
  return grown;
}

bool heap_buffer::allocate(size_t size) {
  reset();
  data_ = static_cast<uint8_t*>(heap_take(size));
  if (data_ == nullptr) return false;
  size_ = capacity_ = size;
  return true;
}

bool heap_buffer::copy_of(byte_view bytes) {
  if (!allocate(bytes.size())) return false;
  copy_bytes(span(), bytes);
  return true;
}

void heap_buffer::reset() {
  heap_give_back(data_, capacity_);
  data_ = nullptr;
  size_ = capacity_ = 0;
}

void heap_buffer::keep(byte_view part) {
  copy_bytes(span(), part);
  size_ = part.size();
}

uint8_t* heap_buffer::release() {
  size_ = capacity_ = 0;
  return std::exchange(data_, nullptr);
}

void heap_buffer::swap(heap_buffer& other) noexcept {
  std::swap(data_, other.data_);
  std::swap(size_, other.size_);
  std::swap(capacity_, other.capacity_);
}

}  // namespace keymaster
