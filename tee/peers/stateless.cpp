// The entry points of a trusted application that keeps nothing between commands: all but the one
// that takes commands.
#include "tee_internal_api.h"

TEE_Result TA_CreateEntryPoint() {
  return TEE_SUCCESS;
}

void TA_DestroyEntryPoint() {}

TEE_Result TA_OpenSessionEntryPoint(uint32_t paramTypes, TEE_Param* /*params*/,
                                    void** /*sessionContext*/) {
  return paramTypes == 0 ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}

void TA_CloseSessionEntryPoint(void* /*sessionContext*/) {}
