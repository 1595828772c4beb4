// Byte strings that hold secrets: they lie where secrets lie and are wiped before they are freed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>
#include <openssl/crypto.h>
#include <vector>

#include "tee/device/secret_memory.h"

namespace tee {

template <typename T>
struct wiping_allocator {
  using value_type = T;
  wiping_allocator() = default;
  template <typename U>
  explicit wiping_allocator(const wiping_allocator<U>& /*other*/) {}
  T* allocate(size_t count) {
    if (count > SIZE_MAX / sizeof(T)) throw std::bad_alloc();
    if (void* block = allocate_secret(count * sizeof(T))) return static_cast<T*>(block);
    throw std::bad_alloc();
  }
  void deallocate(T* block, size_t count) {
    OPENSSL_cleanse(block, count * sizeof(T));
    release_secret(block, count * sizeof(T));
  }
  bool operator==(const wiping_allocator& /*other*/) const { return true; }
};

using secret_bytes = std::vector<uint8_t, wiping_allocator<uint8_t>>;

}  // namespace tee
