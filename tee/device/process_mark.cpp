// The mark of a process lies in a page that a forked process finds empty: the kernel sees to that
// however the process was forked, where it can (Linux 4.14), and the C library after its fork().
#include "tee/device/process_mark.h"

#include <atomic>
#include <new>
#include <pthread.h>
#include <sys/mman.h>
#include <unistd.h>

namespace tee {

namespace {

using mark = std::atomic<uint64_t>;
static_assert(mark::is_always_lock_free);

mark* own_page = nullptr;

mark* map_page() {
  const auto size = static_cast<size_t>(sysconf(_SC_PAGESIZE));
  void* page = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) throw std::bad_alloc();
  madvise(page, size, MADV_WIPEONFORK);
  own_page = static_cast<mark*>(page);
  pthread_atfork(nullptr, nullptr, [] { *own_page = 0; });
  return own_page;
}

// This process's mark: never 0, never that of a process it was forked from.
uint64_t own_mark() {
  static mark* const PAGE = map_page();
  static mark last = 0;  // goes on counting in forked processes
  uint64_t own = PAGE->load(std::memory_order_relaxed);
  if (own != 0) return own;
  const uint64_t fresh = last.fetch_add(1) + 1;
  return PAGE->compare_exchange_strong(own, fresh) ? fresh : own;
}

}  // namespace

process_mark::process_mark() : made_in_(own_mark()) {}

bool process_mark::at_home() const {
  return own_mark() == made_in_;
}

}  // namespace tee
