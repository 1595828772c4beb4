// upgrade_key: seals a key anew under the configured OS version and patch level.
#include "ta/commands/command.h"
#include "ta/commands/configured.h"
#include "ta/commands/opened_key.h"
#include "ta/store/key_blob.h"

namespace keymaster::commands {
namespace {

// Opens a blob of this TA, or of the earlier one. The version checks are not run: an old key is
// what this command is for.
outcome open_any(byte_view client_blob, opened_key* key) {
  if (!key->blob.copy_of(client_blob)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  const byte_view blob = key->blob.view();
  if (!failed(open_key(blob, &key->material, &key->characteristics))) return DONE;
  trace(TEE_TRACE_ERROR, "Open V2 key failed");
  const outcome how = open_v1_key(blob, &key->material, &key->characteristics);
  if (failed(how)) trace(TEE_TRACE_ERROR, "Open V1 key failed");
  return how;
}

// Sets a version tag to the configured value; never lowers it.
bool raise_version(keymaster_key_param_set_t* characteristics, keymaster_tag_t tag,
                   uint32_t configured_value) {
  if (!contains_tag(*characteristics, tag)) {
    return add_integer(characteristics, tag, configured_value);
  }
  keymaster_key_param_t* param = get_unique(*characteristics, tag);
  if (param == nullptr || param->integer > configured_value) return false;
  param->long_integer = configured_value;  // the bytes beyond a version's 32 bits are zero
  return true;
}

keymaster_error_t upgrade_characteristics(keymaster_key_param_set_t* characteristics,
                                          const keymaster_key_param_set_t& params) {
  TRY(check_application(*characteristics, unique_blob(params, KM_TAG_APPLICATION_ID),
                        unique_blob(params, KM_TAG_APPLICATION_DATA)));
  if (raise_version(characteristics, KM_TAG_OS_VERSION, configured().configured_os_version) &&
      raise_version(characteristics, KM_TAG_OS_PATCHLEVEL, configured().configured_os_patchlevel)) {
    return KM_ERROR_OK;
  }
  return refuse(KM_ERROR_INVALID_ARGUMENT, "Can't upgrade key params");
}

}  // namespace

outcome upgrade_key(command_io* io) {
  const trace_scope scope;
  input_cursor in(io->input);
  byte_view marshalled;
  byte_view blob;
  if (!in.read_field(&marshalled) || !in.read_field(&blob)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  keymaster_key_param_set_t params;
  TRY(read_params(marshalled, &params));
  opened_key key;
  TRY(open_any(blob, &key));
  TRY(upgrade_characteristics(&key.characteristics, params));
  return write_blob(key.material.view(), key.characteristics, io->output, &io->output_size);
}

}  // namespace keymaster::commands
