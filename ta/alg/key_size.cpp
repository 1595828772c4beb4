// The size of a new key.
#include "ta/alg/key_size.h"

namespace keymaster {

keymaster_error_t required_key_bits(const keymaster_key_param_set_t& description,
                                    uint32_t* key_bits) {
  const keymaster_key_param_t* size = get_unique(description, KM_TAG_KEY_SIZE);
  if (size == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_KEY_SIZE or specified");
  }
  *key_bits = size->integer;
  return KM_ERROR_OK;
}

keymaster_error_t settle_key_bits(keymaster_key_param_set_t* description, uint64_t guessed_bits,
                                  uint32_t* key_bits) {
  // Data that long never fits the TA's heap; the cut value is refused as a size by every algorithm.
  *key_bits = guessed_bits > UINT32_MAX ? UINT32_MAX : static_cast<uint32_t>(guessed_bits);
  const keymaster_key_param_t* given = get_unique(*description, KM_TAG_KEY_SIZE);
  if (given != nullptr && given->integer != *key_bits) {
    return refuse(KM_ERROR_IMPORT_PARAMETER_MISMATCH, "Key size mismatch (given %d, guessed %d)",
                  static_cast<int>(given->integer), static_cast<int>(*key_bits));
  }
  if (given == nullptr && !add_integer(description, KM_TAG_KEY_SIZE, *key_bits)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return KM_ERROR_OK;
}

}  // namespace keymaster
