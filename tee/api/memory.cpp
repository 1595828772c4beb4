// TEE_Malloc, TEE_Realloc, TEE_Free.
#include "tee_internal_api.h"

#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/profile.h"

using tee::current_instance;
using tee::guarded;

namespace {

// Failures of any kind are null here: allocations have no other way to say it.
template <typename Allocate>
void* allocate(const char* call, Allocate&& from_heap) {
  void* block = nullptr;
  TEE_Result result = guarded(call, [&]() -> TEE_Result {
    tee::heap& heap = current_instance(call).memory();
    if (TEE_Result fault = tee::fault_point()) return fault;
    block = from_heap(heap);
    return TEE_SUCCESS;
  });
  return result == TEE_SUCCESS ? block : nullptr;
}

}  // namespace

void* TEE_Malloc(size_t size, uint32_t hint) {
  constexpr uint32_t KNOWN_HINTS = TEE_MALLOC_NO_FILL | TEE_MALLOC_NO_SHARE;
  const bool strict = tee::current_profile().strict;
  if (strict && (hint & ~KNOWN_HINTS) != 0) tee::panic("TEE_Malloc", "hint 0x%x is unknown", hint);
  const bool zero = strict ? hint == TEE_MALLOC_FILL_ZERO : (hint & TEE_MALLOC_NO_FILL) == 0;
  return allocate("TEE_Malloc", [=](tee::heap& heap) { return heap.allocate(size, zero); });
}

void* TEE_Realloc(void* buffer, size_t newSize) {
  // That more room is zero is promised by nobody.
  const bool zero = !tee::current_profile().strict;
  return allocate("TEE_Realloc",
                  [=](tee::heap& heap) { return heap.resize(buffer, newSize, zero); });
}

void TEE_Free(void* buffer) {
  guarded("TEE_Free", [=] { current_instance("TEE_Free").memory().release(buffer); });
}
