// Where secrets lie: memory that is kept out of core dumps and, as far as the system's limits allow
// it, out of swap. In builds with an address sanitizer it is the ordinary heap, whose blocks the
// sanitizer sees the ends of.
#pragma once

#include <cstddef>

namespace tee {

// allocate_secret: at least `size` bytes, aligned for everything, from any thread; null when there
// is no memory. Blocks above 32 KiB are not locked: keys are small, what is larger comes from
// clients and goes there.
void* allocate_secret(size_t size) noexcept;

// release_secret: gives a block of that size back, which the caller has wiped.
void release_secret(void* block, size_t size) noexcept;

// take_lock_failure: the errno with which memory could not be locked, to the first who asks; 0 when
// it was, or when someone asked before.
int take_lock_failure() noexcept;

}  // namespace tee
