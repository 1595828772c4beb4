// attest_key: a certificate chain for a key.
#include "ta/alg/algorithm.h"
#include "ta/attest/certificate.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"

namespace keymaster::commands {

// The application binding is not asked for: intended, an attestation tells who a key is bound to.
outcome attest_key(command_io* io) {
  const trace_scope scope;
  byte_view blob;
  keymaster_key_param_set_t params;
  TRY(read_use(io->input, &blob, &params));
  opened_key key;
  TRY(open_checked_key(blob, &key));
  const algorithm_t* algorithm = nullptr;
  TRY(operating_algorithm(key.characteristics, &algorithm));
  const outcome how = internal_attest_key({key.material.view(), key.characteristics, params},
                                          io->output, &io->output_size, &io->result);
  if (failed(how)) trace(TEE_TRACE_ERROR, "Attest key failed");
  return how;
}

}  // namespace keymaster::commands
