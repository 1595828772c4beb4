// attest_key: a certificate chain for a key.
#include "ta/alg/algorithm.h"
#include "ta/attest/certificate.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"

namespace keymaster::commands {
namespace {

// Opens the key and sees that its algorithm runs at all. The application binding is not asked for:
// intended, an attestation tells who a key is bound to.
keymaster_error_t open_attested(byte_view blob, opened_key* key) {
  if (auto error = open_checked_key(blob, key)) return error;
  const auto* tag = get_unique(key->characteristics, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    trace_error("No KM_TAG_ALGORITHM");
    return KM_ERROR_UNKNOWN_ERROR;
  }
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm != nullptr && algorithm->get_operation_methods != nullptr) return KM_ERROR_OK;
  trace_error("Algorithm %d not implemented", static_cast<int>(tag->enumerated));
  return KM_ERROR_UNSUPPORTED_ALGORITHM;
}

}  // namespace

TEE_Result attest_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  byte_view blob;
  keymaster_key_param_set_t params;
  if (TEE_Result res = read_use(io->input, &blob, &params)) return res;
  opened_key key;
  *km_error = open_attested(blob, &key);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  const TEE_Result res = internal_attest_key(key.material.view(), key.characteristics, params,
                                             io->output, &io->output_size, &io->result, km_error);
  if (failed(res, *km_error)) TRACE_ERROR("Attest key failed");
  return res;
}

}  // namespace keymaster::commands
