// What the commands share.
#include "ta/commands/opened_key.h"

#include "ta/auth/authorization.h"
#include "ta/commands/configured.h"
#include "ta/params/marshal.h"
#include "ta/store/key_blob.h"

namespace keymaster {

TEE_Result read_params(byte_view marshalled, keymaster_key_param_set_t* params) {
  if (unmarshal(marshalled, params) == TEE_SUCCESS) return TEE_SUCCESS;
  trace_error("Unmarshal failed");
  return TEE_ERROR_BAD_PARAMETERS;
}

TEE_Result read_use(byte_view input, byte_view* blob, keymaster_key_param_set_t* params) {
  input_cursor in(input);
  byte_view marshalled;
  if (!in.read_field(blob) || !in.read_field(&marshalled)) {
    trace_error("Too short input");
    return TEE_ERROR_GENERIC;
  }
  return read_params(marshalled, params);
}

keymaster_error_t open_checked_key(byte_view blob, opened_key* key) {
  if (!key->blob.copy_of(blob)) {
    trace_error("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result res = open_key(key->blob.view(), &key->material, &key->characteristics, &error);
  if (failed(res, error)) {
    // The reason is traced, not told: a blob that does not open asks for an upgrade. Intended.
    trace_error("Open key failed");
    return KM_ERROR_KEY_REQUIRES_UPGRADE;
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

keymaster_error_t open_requested_key(const key_request& request, opened_key* key) {
  if (auto error = open_checked_key(request.blob, key)) return error;
  if (!check_app_id_and_app_data(key->characteristics, request.app_id, request.app_data)) {
    trace_error("Wrong AppId or AppData");
    return KM_ERROR_INVALID_KEY_BLOB;
  }
  return KM_ERROR_OK;
}

TEE_Result write_set(const keymaster_key_param_set_t& set, byte_span room, size_t* written) {
  // marshal takes a null buffer as a wish for a new one; an output without memory has no room.
  uint8_t nowhere = 0;
  uint8_t* buffer = room.data() == nullptr ? &nowhere : room.data();
  uint32_t size = static_cast<uint32_t>(room.size() < UINT32_MAX ? room.size() : UINT32_MAX);
  const TEE_Result res = marshal(set, false, &buffer, &size);
  *written = size;
  return res;
}

}  // namespace keymaster
