// The counter of SOTER signatures.
#include "ta/soter/counter.h"

#include "ta/base/outcome.h"
#include "ta/base/tee_handles.h"

namespace keymaster {
namespace {

// With its terminating zero, which is part of the identifier.
constexpr char COUNTER_OBJECT_ID[] = "SOTER_COUNTER_OBJECT";
static_assert(sizeof(COUNTER_OBJECT_ID) == 21);
constexpr uint32_t COUNTER_FLAGS = TEE_DATA_FLAG_ACCESS_READ | TEE_DATA_FLAG_ACCESS_WRITE;

TEE_Result open_counter(tee_object* object) {
  return TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, COUNTER_OBJECT_ID, sizeof(COUNTER_OBJECT_ID),
                                  COUNTER_FLAGS, object->receive());
}

TEE_Result create_counter(tee_object* object) {
  const uint64_t zero = 0;
  return TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, COUNTER_OBJECT_ID,
                                    sizeof(COUNTER_OBJECT_ID), COUNTER_FLAGS, TEE_HANDLE_NULL,
                                    &zero, sizeof(zero), object->receive());
}

TEE_Result open_or_create_counter(tee_object* object) {
  const TEE_Result res = open_counter(object);
  if (res != TEE_ERROR_ITEM_NOT_FOUND) return res;
  trace(TEE_TRACE_INFO, "No counter object, we need create one\n");
  if (create_counter(object) != TEE_SUCCESS) {
    // Whoever else made it has done what is needed.
    trace(TEE_TRACE_DEBUG, "retry to open counter object");
    return open_counter(object);
  }
  trace(TEE_TRACE_INFO, "Create counter object success\n");
  return TEE_SUCCESS;
}

TEE_Result read_counter(const tee_object& object, uint64_t* counter) {
  // One byte more than expected, so that an object that is too long is seen.
  uint8_t data[sizeof(*counter) + 1];
  tee_size count = 0;
  TRY(TEE_ReadObjectData(object.get(), data, sizeof(data), &count));
  if (count != sizeof(*counter)) {
    return fail(TEE_ERROR_BAD_STATE, "counter object is not %d bytes, %d bytes\n",
                static_cast<int>(sizeof(*counter)), static_cast<int>(count));
  }
  copy_bytes(object_bytes(*counter), byte_view(data).first(sizeof(*counter)));
  return TEE_SUCCESS;
}

// One write, which the platform does whole or not at all.
TEE_Result write_counter(const tee_object& object, uint64_t counter) {
  if (TEE_Result res = TEE_SeekObjectData(object.get(), 0, TEE_DATA_SEEK_SET)) {
    return fail(res, "seek pos to the beginning error\n");
  }
  if (TEE_Result res = TEE_WriteObjectData(object.get(), &counter, sizeof(counter))) {
    return fail(res, "write object error\n");
  }
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result increase_and_get_counter(uint64_t* counter) {
  const trace_scope scope;
  *counter = 0;
  tee_object object;
  uint64_t value = 0;
  TRY(open_or_create_counter(&object));
  TRY(read_counter(object, &value));
  TRY(write_counter(object, value + 1));
  *counter = value + 1;
  return TEE_SUCCESS;
}

}  // namespace keymaster
