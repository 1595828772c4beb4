// The TA's heap: owners over TEE_Malloc. Memory is zero-filled when it is taken and wiped before it
// is given back.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <new>
#include <utility>

#include "ta/base/bytes.h"

namespace keymaster {

// heap_take: zero-filled memory, or null. A request for 0 bytes takes one, so that null always
// means out of memory whatever the platform's heap does with empty requests.
[[nodiscard]] void* heap_take(size_t size);

// heap_give_back: wipes `size` bytes and frees the block. Null is ignored.
void heap_give_back(void* block, size_t size);

// heap_grow: the block of `old_size` bytes grown to `new_size`, moved if need be and the old one
// wiped; null, with the old block untouched, when out of memory.
[[nodiscard]] void* heap_grow(void* block, size_t old_size, size_t new_size);

// heap_buffer: owns a run of bytes. Moves, never copies. An allocated buffer of 0 bytes is
// different from none: its data() is not null.
class heap_buffer {
 public:
  heap_buffer() = default;
  // Takes over a block of `size` bytes that came from heap_take.
  heap_buffer(uint8_t* block, size_t size) : data_(block), size_(size), capacity_(size) {}
  heap_buffer(heap_buffer&& other) noexcept { swap(other); }
  heap_buffer& operator=(heap_buffer&& other) noexcept {
    heap_buffer taken(std::move(other));
    swap(taken);
    return *this;
  }
  ~heap_buffer() { reset(); }

  // False when out of memory; the buffer is then empty.
  [[nodiscard]] bool allocate(size_t size);
  [[nodiscard]] bool copy_of(byte_view bytes);
  void reset();
  // Keeps the first `size` bytes (at most size()) as the contents; the rest stays owned and is
  // wiped with it.
  void truncate(size_t size) { size_ = size < size_ ? size : size_; }
  // Keeps only `part`, which is of this buffer, as the contents, moved to the front; likewise.
  void keep(byte_view part);
  // Hands the block to the caller, who frees it with heap_give_back.
  [[nodiscard]] uint8_t* release();

  explicit operator bool() const { return data_ != nullptr; }
  uint8_t* data() { return data_; }
  size_t size() const { return size_; }
  byte_span span() { return {data_, size_}; }
  byte_view view() const { return {data_, size_}; }

 private:
  void swap(heap_buffer& other) noexcept;

  uint8_t* data_ = nullptr;
  size_t size_ = 0;
  size_t capacity_ = 0;
};

// heap_new, heap_delete: one record on the TA's heap; null when out of memory.
template <class T>
[[nodiscard]] T* heap_new() {
  void* block = heap_take(sizeof(T));
  return block == nullptr ? nullptr : new (block) T();
}
template <class T>
void heap_delete(T* record) {
  if (record == nullptr) return;
  record->~T();
  heap_give_back(record, sizeof(T));
}

// heap_ptr: owns one record of heap_new. Moves, never copies.
template <class T>
class heap_ptr {
 public:
  heap_ptr() = default;
  explicit heap_ptr(T* record) : record_(record) {}
  heap_ptr(heap_ptr&& other) noexcept : record_(std::exchange(other.record_, nullptr)) {}
  heap_ptr& operator=(heap_ptr&& other) noexcept {
    heap_ptr taken(std::move(other));
    std::swap(record_, taken.record_);
    return *this;
  }
  ~heap_ptr() { heap_delete(record_); }

  T* get() const { return record_; }
  // Hands the record to the caller, who frees it with heap_delete.
  [[nodiscard]] T* release() { return std::exchange(record_, nullptr); }
  T* operator->() const { return record_; }
  // NOLINTNEXTLINE(clang-analyzer-core.uninitialized.UndefReturn): of an owner that has a record
  T& operator*() const { return *record_; }
  explicit operator bool() const { return record_ != nullptr; }

 private:
  T* record_ = nullptr;
};

}  // namespace keymaster
