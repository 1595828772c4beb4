// Spare contexts, kept with a key or, where there is none, with an instance: making one and giving
// it the key costs more than most operations on short data, so an operation takes a spare one and
// gives it back.
#pragma once

#include <array>
#include <cstdint>
#include <utility>

namespace tee::crypto {

// Holds up to SIZE spare contexts, each for one use (an algorithm and a mode).
template <typename Pointer>
class context_pool {
 public:
  static constexpr size_t SIZE = 2;

  // take: a spare context for `use`; null when there is none.
  Pointer take(uint64_t use) {
    for (spare& held : spares_) {
      if (held.context && held.use == use) return std::move(held.context);
    }
    return nullptr;
  }

  // give: keeps the context; the one that was given longest ago makes room.
  void give(uint64_t use, Pointer context) {
    for (spare& held : spares_) {
      if (!held.context) {
        held = {use, std::move(context)};
        return;
      }
    }
    spares_[next_] = {use, std::move(context)};
    next_ = (next_ + 1) % SIZE;
  }

 private:
  struct spare {
    uint64_t use = 0;
    Pointer context;
  };
  std::array<spare, SIZE> spares_;
  size_t next_ = 0;
};

}  // namespace tee::crypto
