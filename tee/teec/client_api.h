// The TEE Client API of a TEE that lives in the calling process, for the library that programs link
// with, which loads this one only when somebody wants that.
#pragma once

#include "tee_client_api.h"

namespace tee {

// The functions of tee_client_api.h, each as it is declared there.
struct client_api {
  TEEC_Result (*initialize_context)(const char* name, TEEC_Context* context);
  void (*finalize_context)(TEEC_Context* context);
  TEEC_Result (*register_shared_memory)(TEEC_Context* context, TEEC_SharedMemory* memory);
  TEEC_Result (*allocate_shared_memory)(TEEC_Context* context, TEEC_SharedMemory* memory);
  void (*release_shared_memory)(TEEC_SharedMemory* memory);
  TEEC_Result (*open_session)(TEEC_Context* context, TEEC_Session* session,
                              const TEEC_UUID* destination, uint32_t connection_method,
                              const void* connection_data, TEEC_Operation* operation,
                              uint32_t* return_origin);
  void (*close_session)(TEEC_Session* session);
  TEEC_Result (*invoke_command)(TEEC_Session* session, uint32_t command, TEEC_Operation* operation,
                                uint32_t* return_origin);
  void (*request_cancellation)(TEEC_Operation* operation);
};

}  // namespace tee

// The one symbol by which the two libraries know each other: they are built and installed together.
extern "C" __attribute__((visibility("default"))) const tee::client_api*
tee_client_api_in_process();
