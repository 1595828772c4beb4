// What the commands share.
#include "ta/commands/opened_key.h"

#include "ta/auth/authorization.h"
#include "ta/commands/configured.h"
#include "ta/params/marshal.h"
#include "ta/store/key_blob.h"

namespace keymaster {

TEE_Result read_params(byte_view marshalled, keymaster_key_param_set_t* params) {
  if (unmarshal(marshalled, params) == TEE_SUCCESS) return TEE_SUCCESS;
  return fail(TEE_ERROR_BAD_PARAMETERS, "Unmarshal failed");
}

TEE_Result read_use(byte_view input, byte_view* blob, keymaster_key_param_set_t* params) {
  input_cursor in(input);
  byte_view marshalled;
  if (!in.read_field(blob) || !in.read_field(&marshalled)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  return read_params(marshalled, params);
}

keymaster_error_t open_checked_key(byte_view blob, opened_key* key) {
  if (!key->blob.copy_of(blob)) return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  if (failed(open_key(key->blob.view(), &key->material, &key->characteristics))) {
    // The reason is traced, not told: a blob that does not open asks for an upgrade. Intended.
    return refuse(KM_ERROR_KEY_REQUIRES_UPGRADE, "Open key failed");
  }
  if (key_requires_upgrade(key->characteristics)) return KM_ERROR_KEY_REQUIRES_UPGRADE;
  if (key_version_mismatch(key->characteristics)) return KM_ERROR_INVALID_KEY_BLOB;
  return KM_ERROR_OK;
}

bool read_key_request(byte_view input, key_request* request) {
  input_cursor in(input);
  return in.read_field(&request->blob) && in.read_field(&request->app_id) &&
         in.read_field(&request->app_data);
}

keymaster_error_t check_application(const keymaster_key_param_set_t& characteristics,
                                    byte_view app_id, byte_view app_data) {
  if (check_app_id_and_app_data(characteristics, app_id, app_data)) return KM_ERROR_OK;
  return refuse(KM_ERROR_INVALID_KEY_BLOB, "Wrong AppId or AppData");
}

keymaster_error_t open_requested_key(const key_request& request, opened_key* key) {
  TRY(open_checked_key(request.blob, key));
  return check_application(key->characteristics, request.app_id, request.app_data);
}

keymaster_error_t operating_algorithm(const keymaster_key_param_set_t& characteristics,
                                      const algorithm_t** algorithm) {
  const auto* tag = get_unique(characteristics, KM_TAG_ALGORITHM);
  if (tag == nullptr) return refuse(KM_ERROR_UNKNOWN_ERROR, "No KM_TAG_ALGORITHM");
  *algorithm = find_algorithm(tag->enumerated);
  if (*algorithm != nullptr && (*algorithm)->get_operation_methods != nullptr) return KM_ERROR_OK;
  return refuse(KM_ERROR_UNSUPPORTED_ALGORITHM, "Algorithm %d not implemented",
                static_cast<int>(tag->enumerated));
}

TEE_Result write_blob(byte_view material, const keymaster_key_param_set_t& characteristics,
                      byte_span room, size_t* size) {
  const TEE_Result res = save_key(material, characteristics, room, size);
  return res == TEE_SUCCESS ? res : fail(res, "Can't save key to TEE storage");
}

TEE_Result write_set(const keymaster_key_param_set_t& set, byte_span room, size_t* written) {
  // marshal takes a null buffer as a wish for a new one; an output without memory has no room.
  uint8_t nowhere = 0;
  uint8_t* buffer = room.data() == nullptr ? &nowhere : room.data();
  uint32_t size = static_cast<uint32_t>(room.size() < UINT32_MAX ? room.size() : UINT32_MAX);
  const TEE_Result res = marshal(set, false, &buffer, &size);
  *written = size;
  return res == TEE_SUCCESS ? res : fail(res, "Marshal failed");
}

TEE_Result write_last_set(const keymaster_key_param_set_t& set, output_cursor* out, size_t* total) {
  byte_span length;
  if (!out->reserve(sizeof(uint32_t), &length)) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  size_t size = 0;
  TRY(write_set(set, out->rest(), &size));
  store_u32(length, static_cast<uint32_t>(size));
  *total = out->written() + size;
  return TEE_SUCCESS;
}

}  // namespace keymaster
