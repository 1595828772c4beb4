// Byte strings that hold secrets: their memory is wiped before it is freed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <openssl/crypto.h>
#include <vector>

namespace tee {

template <typename T>
struct wiping_allocator {
  using value_type = T;
  wiping_allocator() = default;
  template <typename U>
  explicit wiping_allocator(const wiping_allocator<U>& /*other*/) {}
  T* allocate(size_t count) { return std::allocator<T>().allocate(count); }
  void deallocate(T* block, size_t count) {
    OPENSSL_cleanse(block, count * sizeof(T));
    std::allocator<T>().deallocate(block, count);
  }
  bool operator==(const wiping_allocator& /*other*/) const { return true; }
};

using secret_bytes = std::vector<uint8_t, wiping_allocator<uint8_t>>;

}  // namespace tee
