// TEE_Malloc, TEE_Realloc, TEE_Free.
#include "tee_internal_api.h"

#include "tee/core/faults.h"
#include "tee/core/instance.h"

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
  bool zero = (hint & TEE_MALLOC_NO_FILL) == 0;
  return allocate("TEE_Malloc", [=](tee::heap& heap) { return heap.allocate(size, zero); });
}

void* TEE_Realloc(void* buffer, size_t newSize) {
  return allocate("TEE_Realloc", [=](tee::heap& heap) { return heap.resize(buffer, newSize); });
}

void TEE_Free(void* buffer) {
  guarded("TEE_Free", [=] { current_instance("TEE_Free").memory().release(buffer); });
}
