// The commands of the biometric framework. Those that answer through the value slot always succeed
// towards the TEE.
#include "ta/commands/command.h"
#include "ta/soter/attk.h"
#include "ta/soter/finger_id.h"
#include "ta/soter/provisioning.h"
#include "ta/vault/vault.h"

namespace keymaster::commands {
namespace {

// What the value slot says beside Keymaster's own codes.
constexpr keymaster_error_t ATTK_MISSING = -1;
constexpr keymaster_error_t ATTK_FAILED = -2;
constexpr keymaster_error_t SOTER_NOT_READY = -1;

constexpr int LOAD_ATTEMPTS = 3;

constexpr uint8_t REQUEST_DEVICE_ID[] = {0x34, 0x19, 0x36, 0x19};

TEE_Result export_attk(byte_span output, size_t* length) {
  uint32_t key_bits = 0;
  const tee_object key = convert_key_to_object(soter_key_pair(), &key_bits);
  if (!key) return TEE_ERROR_BAD_FORMAT;
  return export_rsa_public_key(key.get(), key_bits, output, length);
}

}  // namespace

// Generates nothing, whatever its name says: intended, the factory makes the key.
outcome soter_handle_generate_attk_key_pair(command_io*) {
  const trace_scope scope;
  trace(TEE_TRACE_INFO, "this function should not be called in anytime but in meta mode\n");
  if (soter_check_init() == TEE_SUCCESS) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "attk_key_pair is not produced\n");
}

// Loads the key anew, whether or not it is loaded: the question is what the vault has.
outcome soter_handle_verify_attk_key_pair(command_io*) {
  TEE_Result res = TEE_ERROR_OUT_OF_MEMORY;
  for (int attempt = 0; attempt < LOAD_ATTEMPTS && res == TEE_ERROR_OUT_OF_MEMORY; attempt++) {
    soter_key_pair_t attk;
    res = init_soter_key(&attk);
  }
  if (res == TEE_SUCCESS) return DONE;
  return res == TEE_ERROR_ITEM_NOT_FOUND ? ATTK_MISSING : ATTK_FAILED;
}

outcome soter_handle_export_attk_public_key(command_io* io) {
  if (io->output.data() == nullptr) return KM_ERROR_INVALID_ARGUMENT;
  if (soter_check_init() != TEE_SUCCESS) return SOTER_NOT_READY;
  const TEE_Result res = export_attk(io->output, &io->output_size);
  return res == TEE_SUCCESS ? KM_ERROR_OK : KM_ERROR_UNKNOWN_ERROR;
}

outcome soter_handle_get_device_id(command_io* io) {
  const trace_scope scope;
  size_t length = io->output.size();
  const TEE_Result res =
      retrieve_property_from_vault(REQUEST_DEVICE_ID, io->output.data(), &length);
  if (res == TEE_ERROR_SHORT_BUFFER) return KM_ERROR_INSUFFICIENT_BUFFER_SPACE;
  if (res != TEE_SUCCESS) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "retrieve_device_id_from_vault fail, 0x%x\n", res);
  }
  io->output_size = length;
  return DONE;
}

outcome soter_handle_setFid(command_io* io) {
  const trace_scope scope;
  trace(TEE_TRACE_DEBUG, "soter handle finger print ta notify");
  if (TEE_Result res = is_from_fp_ta()) return fail(res, "soter deny finger print ta");
  TRY(take_notification(io->input));
  trace(TEE_TRACE_DEBUG, "soter handle finger print ta notify success");
  return DONE;
}

}  // namespace keymaster::commands
