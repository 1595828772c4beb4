// libteec: the TEE Client API 1.0 as programs link it. It holds no TEE and no secret: the TEE is in
// another process, or a library of its own, which is loaded with the first context on it.
#include "tee_client_api.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <dlfcn.h>
#include <new>
#include <string>
#include <string_view>

#include "tee/remote/remote.h"
#include "tee/teec/client_api.h"
#include "tee/teec/imp_table.h"
#include "tee/wire/connect.h"

namespace {

constexpr const char* TEE_LIBRARY = "libtee.so.1";

using tee::client_api;

// Null until a context was asked for. The library stays until the process ends: threads may be in
// it.
std::atomic<const client_api*> loaded{nullptr};

// The one that the process has already, else the one beside this library.
void* open_library() {
  if (void* present = dlopen(TEE_LIBRARY, RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD)) return present;
  Dl_info own{};
  std::string path = TEE_LIBRARY;
  if (dladdr(&loaded, &own) != 0 && own.dli_fname != nullptr) {
    const std::string here = own.dli_fname;
    path = here.substr(0, here.rfind('/') + 1) + TEE_LIBRARY;
  }
  return dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
}

const client_api* load() {
  if (const client_api* api = loaded.load(std::memory_order_acquire)) return api;
  void* library = open_library();
  void* found = library != nullptr ? dlsym(library, "tee_client_api_in_process") : nullptr;
  if (found == nullptr) {
    fprintf(stderr, "[TEE] %s\n", dlerror());
    return nullptr;
  }
  const auto in_process = reinterpret_cast<decltype(&tee_client_api_in_process)>(found);
  loaded.store(in_process(), std::memory_order_release);
  return loaded;
}

// What is behind a structure's number: without a context there can be nothing.
const client_api* api_of(const void* imp) {
  if (tee::way_of(imp) == tee::way::SERVED) return &tee::remote::api();
  return loaded.load(std::memory_order_acquire);
}

template <typename Structure>
const client_api* api_behind(const Structure* structure) {
  return structure != nullptr ? api_of(structure->imp) : nullptr;
}

TEEC_Result refuse(uint32_t* return_origin) {
  if (return_origin != nullptr) *return_origin = TEEC_ORIGIN_API;
  return TEEC_ERROR_BAD_PARAMETERS;
}

}  // namespace

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* context) try {
  if (context == nullptr) return TEEC_ERROR_BAD_PARAMETERS;
  context->imp = nullptr;
  // A program with raised rights does not use the device that its caller's environment names.
  if (name == nullptr) name = secure_getenv("KEYMASTER_DEVICE");
  const std::string_view given = name != nullptr ? name : "";
  if (given.starts_with(tee::wire::SERVED)) {
    return tee::remote::api().initialize_context(name + tee::wire::SERVED.size(), context);
  }
  if (given.starts_with(tee::wire::IN_PROCESS)) name += tee::wire::IN_PROCESS.size();
  if (name != nullptr && *name == '\0') name = nullptr;
  const client_api* api = load();
  return api != nullptr ? api->initialize_context(name, context) : TEEC_ERROR_COMMUNICATION;
} catch (const std::bad_alloc&) {
  return TEEC_ERROR_OUT_OF_MEMORY;
}

void TEEC_FinalizeContext(TEEC_Context* context) {
  if (const client_api* api = api_behind(context)) api->finalize_context(context);
}

TEEC_Result TEEC_RegisterSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  const client_api* api = api_behind(context);
  return api != nullptr ? api->register_shared_memory(context, sharedMem) : refuse(nullptr);
}

TEEC_Result TEEC_AllocateSharedMemory(TEEC_Context* context, TEEC_SharedMemory* sharedMem) {
  const client_api* api = api_behind(context);
  return api != nullptr ? api->allocate_shared_memory(context, sharedMem) : refuse(nullptr);
}

void TEEC_ReleaseSharedMemory(TEEC_SharedMemory* sharedMemory) {
  if (const client_api* api = api_behind(sharedMemory)) api->release_shared_memory(sharedMemory);
}

TEEC_Result TEEC_OpenSession(TEEC_Context* context, TEEC_Session* session,
                             const TEEC_UUID* destination, uint32_t connectionMethod,
                             const void* connectionData, TEEC_Operation* operation,
                             uint32_t* returnOrigin) {
  if (session != nullptr) session->imp = nullptr;
  const client_api* api = api_behind(context);
  if (api == nullptr) return refuse(returnOrigin);
  return api->open_session(context, session, destination, connectionMethod, connectionData,
                           operation, returnOrigin);
}

void TEEC_CloseSession(TEEC_Session* session) {
  if (const client_api* api = api_behind(session)) api->close_session(session);
}

TEEC_Result TEEC_InvokeCommand(TEEC_Session* session, uint32_t commandID, TEEC_Operation* operation,
                               uint32_t* returnOrigin) {
  const client_api* api = api_behind(session);
  if (api == nullptr) return refuse(returnOrigin);
  return api->invoke_command(session, commandID, operation, returnOrigin);
}

void TEEC_RequestCancellation(TEEC_Operation* operation) {
  if (operation == nullptr) return;  // it does not tell whose it is: both are asked
  tee::remote::api().request_cancellation(operation);
  if (const client_api* api = loaded.load(std::memory_order_acquire)) {
    api->request_cancellation(operation);
  }
}
