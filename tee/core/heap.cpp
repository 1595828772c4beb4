// Blocks are found by address in a hash table beside them, so that nothing but the caller's bytes
// lies in a block's allocation and a foreign address can be told from a live block without reading
// there.
#include "tee/core/heap.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "tee/core/panic.h"
#include "tee/device/secret_memory.h"

namespace tee {
namespace {

constexpr size_t FIRST_TABLE = 64;
constexpr int UNFILLED = 0xA5;

struct {
  block_hook hook = nullptr;
  void* context = nullptr;
} watcher;

void show(block_stage stage, const void* block, size_t size) {
  if (watcher.hook) {
    watcher.hook(watcher.context, stage, static_cast<const uint8_t*>(block), size);
  }
}

// Allocations are multiples of 16 apart; the multiplication spreads them over the upper bits.
size_t spread(const void* block) {
  auto number = static_cast<uint64_t>(reinterpret_cast<uintptr_t>(block));
  return static_cast<size_t>((number * 0x9E3779B97F4A7C15U) >> 32);
}

size_t charge_of(size_t size) {
  return size > 0 ? size : heap::EMPTY_CHARGE;
}

void wipe_and_free(void* block, size_t size) {
  show(block_stage::RELEASED, block, size);
  if (size > 0) explicit_bzero(block, size);
  show(block_stage::WIPED, block, size);
  release_secret(block, size);
}

}  // namespace

inline size_t heap::slot_of(const void* block) const {
  const entry* table = table_.data();
  const size_t mask = table_.size() - 1;
  size_t slot = spread(block) & mask;
  while (table[slot].block && table[slot].block != block)
    slot = (slot + 1) & mask;
  return slot;
}

inline size_t heap::live_slot(const char* call, const void* block) const {
  const size_t slot = table_.empty() ? 0 : slot_of(block);
  if (table_.empty() || !table_[slot].block) {
    panic(call, "%p is not a live block of this heap", block);
  }
  return slot;
}

// Closes the gap: every entry behind it up to the next free slot that could not be found any more
// moves into it.
inline void heap::erase(size_t gap) {
  entry* table = table_.data();
  bytes_ -= charge_of(table[gap].size);
  --count_;
  const size_t mask = table_.size() - 1;
  for (size_t slot = (gap + 1) & mask; table[slot].block; slot = (slot + 1) & mask) {
    size_t home = spread(table[slot].block) & mask;
    if (((slot - home) & mask) >= ((slot - gap) & mask)) {
      table[gap] = table[slot];
      gap = slot;
    }
  }
  table[gap] = {};
}

heap::~heap() {
  release_all();
}

void* heap::allocate(size_t size, bool zero) {
  if (charge_of(size) > limit_ - bytes_) return nullptr;
  if ((count_ + 1) * 2 > table_.size()) grow();
  void* block = allocate_secret(size);
  if (!block) return nullptr;
  if (size > 0) std::memset(block, zero ? 0 : UNFILLED, size);
  table_[slot_of(block)] = {block, size};
  bytes_ += charge_of(size);
  ++count_;
  return block;
}

void* heap::resize(void* block, size_t size, bool zero) {
  if (!block) return allocate(size, true);
  const size_t old_size = table_[live_slot("TEE_Realloc", block)].size;
  void* moved = allocate(size, zero);
  if (!moved) return nullptr;
  if (size_t kept = std::min(old_size, size); kept > 0) std::memcpy(moved, block, kept);
  release(block);
  return moved;
}

void heap::release(void* block) {
  if (!block) return;
  const size_t slot = live_slot("TEE_Free", block);
  const size_t size = table_[slot].size;
  erase(slot);
  wipe_and_free(block, size);
}

void heap::release_all() {
  for (entry& held : std::exchange(table_, {})) {
    if (held.block) wipe_and_free(held.block, held.size);
  }
  bytes_ = 0;
  count_ = 0;
}

void heap::grow() {
  std::vector<entry> larger(std::max(FIRST_TABLE, table_.size() * 2));
  std::swap(table_, larger);
  for (const entry& held : larger) {
    if (held.block) table_[slot_of(held.block)] = held;
  }
}

void set_block_hook(block_hook hook, void* context) {
  watcher.hook = hook;
  watcher.context = context;
}

}  // namespace tee
