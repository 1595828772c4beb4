// The functions behind client_api.h.
#pragma once

#include "tee/teec/client_api.h"

namespace tee::in_process {

TEEC_Result initialize_context(const char* name, TEEC_Context* context);
void finalize_context(TEEC_Context* context);
TEEC_Result open_session(TEEC_Context* context, TEEC_Session* session, const TEEC_UUID* destination,
                         uint32_t connection_method, const void* connection_data,
                         TEEC_Operation* operation, uint32_t* return_origin);
void close_session(TEEC_Session* session);
TEEC_Result invoke_command(TEEC_Session* session, uint32_t command, TEEC_Operation* operation,
                           uint32_t* return_origin);
void request_cancellation(TEEC_Operation* operation);

TEEC_Result register_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory);
TEEC_Result allocate_shared_memory(TEEC_Context* context, TEEC_SharedMemory* memory);
void release_shared_memory(TEEC_SharedMemory* memory);

}  // namespace tee::in_process
