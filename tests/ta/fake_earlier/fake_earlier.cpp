// An earlier Keymaster that misbehaves. Command 27 answers with the code that the first four bytes
// of the blob say (little-endian); when that is success, it claims to have written one byte more
// than there was room for.
#include "tee_internal_api.h"

TEE_Result TA_InvokeCommandEntryPoint(void*, uint32_t command, uint32_t types, TEE_Param* params) {
  const bool asked_well = command == 27 && types == 0x7 && params[0].memref.size >= 4;
  if (!asked_well) return TEE_ERROR_BAD_PARAMETERS;
  const auto* blob = static_cast<const uint8_t*>(params[0].memref.buffer);
  const uint32_t code =
      blob[0] | uint32_t{blob[1]} << 8 | uint32_t{blob[2]} << 16 | uint32_t{blob[3]} << 24;
  params[0].memref.size++;
  return code;
}
