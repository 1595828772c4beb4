// Blobs of the earlier Keymaster TA, which that TA alone can open.
#include "product/uuids.h"
#include "ta/base/results.h"
#include "ta/base/tee_session.h"
#include "ta/store/blob_plaintext.h"
#include "ta/store/key_blob.h"

namespace keymaster {
namespace {

constexpr TEE_UUID EARLIER_KEYMASTER = EARLIER_KEYMASTER_TA_UUID;

// Slot 0, memory in and out: the blob; on return its plaintext, in a key blob's plaintext layout.
constexpr uint32_t COMMAND_OPEN_BLOB = 27;
constexpr uint32_t OPEN_BLOB_TYPES = TEE_PARAM_TYPES(
    TEE_PARAM_TYPE_MEMREF_INOUT, TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE);

// Has the earlier TA replace the blob in *copy by its plaintext, and *copy cut to that.
TEE_Result ask_earlier_keymaster(heap_buffer* copy) {
  tee_session session;
  if (TEE_Result res = session.open(EARLIER_KEYMASTER, 0)) {
    trace_error("OpenTASession failed with 0x%08x\n", res);
    return res;
  }
  TEE_Param params[4] = {};
  params[0].memref.buffer = copy->data();
  params[0].memref.size = static_cast<tee_size>(copy->size());
  if (TEE_Result res = session.invoke(COMMAND_OPEN_BLOB, OPEN_BLOB_TYPES, params)) {
    trace_error("InvokeTACommand failed with 0x%08x\n", res);
    return res;
  }
  // A size above what was offered comes back as it is.
  if (params[0].memref.size > copy->size()) {
    trace_error("Too long answer");
    return TEE_ERROR_GENERIC;
  }
  copy->truncate(params[0].memref.size);
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result open_v1_key(byte_view blob, heap_buffer* key, keymaster_key_param_set_t* characteristics,
                       keymaster_error_t* km_error) {
  const trace_scope scope;
  key->reset();
  *characteristics = {};
  *km_error = KM_ERROR_OK;
  heap_buffer plaintext;
  if (!plaintext.copy_of(blob)) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  if (TEE_Result res = ask_earlier_keymaster(&plaintext)) return res;
  const TEE_Result res =
      parse_plaintext(&plaintext, KM_ERROR_INVALID_KEY_BLOB, characteristics, km_error);
  if (!failed(res, *km_error)) *key = std::move(plaintext);
  return res;
}

}  // namespace keymaster
