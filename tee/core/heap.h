// The heap of a trusted application: bounded, accounted, wiped when freed. Blocks lie where secrets
// lie; each is an allocation of its own, so that an address sanitizer sees one byte too far.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tee {

// set_block_hook: has every heap block that is freed shown twice: as the trusted application left
// it, and after the heap wiped it. Tests look for secrets in the clear there. Null: none.
enum class block_stage { RELEASED, WIPED };
using block_hook = void (*)(void* context, block_stage stage, const uint8_t* block, size_t size);
void set_block_hook(block_hook hook, void* context);

class heap {
 public:
  static constexpr size_t EMPTY_CHARGE = 16;

  // `limit` bounds what the live blocks are charged, in bytes: their sizes, EMPTY_CHARGE for a
  // block of size 0.
  explicit heap(size_t limit) : limit_(limit) {}
  heap(const heap&) = delete;
  heap& operator=(const heap&) = delete;
  ~heap();

  // allocate: `size` bytes, zeros when `zero`, else 0xA5; null when the limit would be passed. A
  // block of size 0 is a unique address that must not be dereferenced.
  void* allocate(size_t size, bool zero);

  // resize: as TEE_Realloc; the new part is filled as by allocate. Null, and the old block
  // untouched, when the limit would be passed (both blocks count while the content moves). Panics
  // for an address that is no live block.
  void* resize(void* block, size_t size, bool zero);

  // release: wipes and frees. Null has no effect; panics for an address that is no live block.
  void release(void* block);

  // release_all: wipes and frees every live block.
  void release_all();

  size_t live_bytes() const { return bytes_; }
  size_t live_blocks() const { return count_; }

 private:
  struct entry {
    void* block = nullptr;
    size_t size = 0;
  };

  size_t slot_of(const void* block) const;  // where it is, or the free slot where it would go
  void erase(size_t slot);
  void grow();
  size_t live_slot(const char* call, const void* block) const;  // panics when it is not there

  size_t limit_;
  size_t bytes_ = 0;
  size_t count_ = 0;
  std::vector<entry> table_;  // open addressing; a power of two long, at most half full
};

}  // namespace tee
