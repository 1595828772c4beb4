// The mark of a process lies in a page that the kernel hands to a forked process as zeros.
#include "tee/device/process_mark.h"

#include <atomic>
#include <sys/mman.h>
#include <unistd.h>

namespace tee {

namespace {

using mark = std::atomic<uint64_t>;
static_assert(mark::is_always_lock_free);

// Null where the kernel cannot do that (before Linux 4.14).
mark* map_mark() {
  const auto size = static_cast<size_t>(sysconf(_SC_PAGESIZE));
  void* page = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) return nullptr;
  if (madvise(page, size, MADV_WIPEONFORK) == 0) return static_cast<mark*>(page);
  munmap(page, size);
  return nullptr;
}

// This process's mark: never 0, never that of a process it was forked from.
uint64_t own_mark() {
  static mark* const page = map_mark();
  static mark last = 0;  // goes on counting in forked processes
  if (page == nullptr) return static_cast<uint64_t>(getpid());
  uint64_t own = page->load(std::memory_order_relaxed);
  if (own != 0) return own;
  const uint64_t fresh = last.fetch_add(1) + 1;
  return page->compare_exchange_strong(own, fresh) ? fresh : own;
}

}  // namespace

process_mark::process_mark() : made_in_(own_mark()) {}

bool process_mark::at_home() const {
  return own_mark() == made_in_;
}

}  // namespace tee
