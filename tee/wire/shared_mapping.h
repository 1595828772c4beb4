// A mapping of memory that two processes share.
#pragma once

#include <cstddef>
#include <cstdint>

#include "tee/device/file_descriptor.h"

namespace tee::wire {

// Both processes read and write it at any time. It is kept out of core dumps.
class shared_mapping {
 public:
  shared_mapping() = default;

  // Maps `size` bytes, at least one, of `memory`, whose size is fixed. Throws std::bad_alloc.
  shared_mapping(file_descriptor memory, size_t size);
  shared_mapping(const shared_mapping&) = delete;
  shared_mapping& operator=(const shared_mapping&) = delete;
  shared_mapping(shared_mapping&& other) noexcept;
  shared_mapping& operator=(shared_mapping&& other) noexcept;
  ~shared_mapping();

  // make: fresh memory, zeros. Throws std::bad_alloc.
  static shared_mapping make(size_t size);

  uint8_t* data() const { return data_; }
  size_t size() const { return size_; }

  // close_descriptor: the mapping stays. A server has few descriptors for many clients.
  void close_descriptor() { memory_ = {}; }
  int descriptor() const { return memory_.get(); }

 private:
  file_descriptor memory_;
  uint8_t* data_ = nullptr;
  size_t size_ = 0;
};

}  // namespace tee::wire
