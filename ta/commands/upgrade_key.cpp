// upgrade_key: seals a key anew under the configured OS version and patch level.
#include "ta/auth/authorization.h"
#include "ta/commands/command.h"
#include "ta/commands/configured.h"
#include "ta/commands/opened_key.h"
#include "ta/store/key_blob.h"

namespace keymaster::commands {
namespace {

// Opens a blob of this TA, or of the earlier one. The version checks are not run: an old key is
// what this command is for.
TEE_Result open_any(byte_view client_blob, opened_key* key, keymaster_error_t* km_error) {
  if (!key->blob.copy_of(client_blob)) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  TEE_Result res = open_key(key->blob.view(), &key->material, &key->characteristics, km_error);
  if (!failed(res, *km_error)) return TEE_SUCCESS;
  trace_error("Open V2 key failed");
  res = open_v1_key(key->blob.view(), &key->material, &key->characteristics, km_error);
  if (failed(res, *km_error)) trace_error("Open V1 key failed");
  return res;
}

// Sets a version tag to the configured value; never lowers it.
bool raise_version(keymaster_key_param_set_t* characteristics, keymaster_tag_t tag,
                   uint32_t configured_value) {
  if (!contains_tag(*characteristics, tag)) {
    return add_integer(characteristics, tag, configured_value);
  }
  keymaster_key_param_t* param = get_unique(*characteristics, tag);
  if (param == nullptr || param->integer > configured_value) return false;
  param->integer = configured_value;
  return true;
}

keymaster_error_t upgrade_characteristics(keymaster_key_param_set_t* characteristics,
                                          const keymaster_key_param_set_t& params) {
  if (!check_app_id_and_app_data(*characteristics, unique_blob(params, KM_TAG_APPLICATION_ID),
                                 unique_blob(params, KM_TAG_APPLICATION_DATA))) {
    trace_error("Wrong AppId or AppData");
    return KM_ERROR_INVALID_KEY_BLOB;
  }
  if (!raise_version(characteristics, KM_TAG_OS_VERSION, configured().configured_os_version) ||
      !raise_version(characteristics, KM_TAG_OS_PATCHLEVEL,
                     configured().configured_os_patchlevel)) {
    trace_error("Can't upgrade key params");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  return KM_ERROR_OK;
}

}  // namespace

TEE_Result upgrade_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  input_cursor in(io->input);
  byte_view marshalled;
  byte_view blob;
  if (!in.read_field(&marshalled) || !in.read_field(&blob)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  keymaster_key_param_set_t params;
  if (TEE_Result res = read_params(marshalled, &params)) return res;
  opened_key key;
  const TEE_Result res = open_any(blob, &key, km_error);
  if (failed(res, *km_error)) return res;
  *km_error = upgrade_characteristics(&key.characteristics, params);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  if (TEE_Result saved =
          save_key(key.material.view(), key.characteristics, io->output, &io->output_size)) {
    return TEE_FAIL(saved, "Can't save key to TEE storage");
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster::commands
