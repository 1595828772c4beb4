// Blobs of the earlier Keymaster TA, which that TA alone can open.
#include "keymaster/store/key_blob.h"

namespace keymaster {

TEE_Result open_v1_key(byte_view, heap_buffer* key, keymaster_key_param_set_t* characteristics,
                       keymaster_error_t* km_error) {
  key->reset();
  *characteristics = {};
  *km_error = KM_ERROR_OK;
  // No earlier TA is known to this build: as if its session had not been found.
  return TEE_FAIL(TEE_ERROR_ITEM_NOT_FOUND, "OpenTASession failed with 0x%08x\n",
                  TEE_ERROR_ITEM_NOT_FOUND);
}

}  // namespace keymaster
