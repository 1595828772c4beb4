// Blobs of the earlier Keymaster TA, which that TA alone can open.
#include "product/uuids.h"
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
  TRY(checked(session.open(EARLIER_KEYMASTER, 0), "OpenTASession"));
  TEE_Param params[4] = {};
  params[0].memref.buffer = copy->data();
  params[0].memref.size = static_cast<tee_size>(copy->size());
  TRY(checked(session.invoke(COMMAND_OPEN_BLOB, OPEN_BLOB_TYPES, params), "InvokeTACommand"));
  // A size above what was offered comes back as it is.
  if (params[0].memref.size > copy->size()) return fail(TEE_ERROR_GENERIC, "Too long answer");
  copy->truncate(params[0].memref.size);
  return TEE_SUCCESS;
}

}  // namespace

outcome open_v1_key(byte_view blob, heap_buffer* key, keymaster_key_param_set_t* characteristics) {
  const trace_scope scope;
  key->reset();
  *characteristics = {};
  heap_buffer plaintext;
  if (!plaintext.copy_of(blob)) return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  TRY(ask_earlier_keymaster(&plaintext));
  TRY(parse_plaintext(&plaintext, KM_ERROR_INVALID_KEY_BLOB, characteristics));
  *key = std::move(plaintext);
  return DONE;
}

}  // namespace keymaster
