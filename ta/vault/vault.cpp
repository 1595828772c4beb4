// The client of the vault.
#include "ta/vault/vault.h"

#include "product/uuids.h"
#include "ta/base/bytes.h"
#include "ta/base/outcome.h"
#include "ta/base/tee_session.h"

namespace keymaster {
namespace {

constexpr TEE_UUID VAULT = VAULT_TA_UUID;

constexpr size_t REQUEST_SIZE = 4;

constexpr uint32_t BYTES_AND_LENGTH =
    TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_NONE,
                    TEE_PARAM_TYPE_NONE);
constexpr uint32_t REQUEST_AND_BYTES =
    TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_NONE,
                    TEE_PARAM_TYPE_NONE);

struct vault_command {
  uint32_t id;
  uint32_t types;
  const char* what;        // in trace lines
  uint32_t failure_level;  // of its trace line
};

constexpr vault_command RETRIEVE_KEY = {2, BYTES_AND_LENGTH, "key", TEE_TRACE_ERROR};
constexpr vault_command RETRIEVE_DATA = {5, BYTES_AND_LENGTH, "TA data", TEE_TRACE_INFO};
constexpr vault_command RETRIEVE_PROPERTY = {12, REQUEST_AND_BYTES, "TA property", TEE_TRACE_ERROR};

// Carries out one command in a session of its own. `*length`: capacity of the output slot's buffer
// on entry, what the vault wrote on success.
TEE_Result call_vault(const vault_command& command, TEE_Param* params, size_t* length) {
  tee_session session;
  if (TEE_Result res = session.open(VAULT, TEE_TIMEOUT_INFINITE)) {
    return fail(res, "Open vault session fails, 0x%x\n", res);
  }
  TEE_Result res = session.invoke(command.id, command.types, params);
  const size_t reported =
      command.types == BYTES_AND_LENGTH ? params[1].value.a : params[1].memref.size;
  if (res == TEE_SUCCESS && reported > *length) res = TEE_ERROR_GENERIC;
  if (res == TEE_SUCCESS) {
    *length = reported;
    trace(TEE_TRACE_DEBUG, "Retrieve %s success\n", command.what);
  } else {
    trace(command.failure_level, "Retrieve %s fails, 0x%x\n", command.what, res);
  }
  return res;
}

TEE_Result retrieve_bytes(const vault_command& command, uint8_t* buffer, size_t size,
                          size_t* used_length) {
  if (buffer == nullptr) return fail(TEE_ERROR_SHORT_BUFFER, "Buf is null\n");
  if (used_length == nullptr) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "used_length pointer is null\n");
  }
  TEE_Param params[4] = {};
  params[0].memref.buffer = buffer;
  params[0].memref.size = static_cast<tee_size>(size);
  TRY(call_vault(command, params, &size));
  *used_length = size;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result retrieve_key_from_vault(uint8_t* buffer, size_t size, size_t* used_length) {
  const trace_scope scope;
  return retrieve_bytes(RETRIEVE_KEY, buffer, size, used_length);
}

TEE_Result retrieve_data_from_vault(uint8_t* buffer, size_t size, size_t* used_length) {
  const trace_scope scope;
  return retrieve_bytes(RETRIEVE_DATA, buffer, size, used_length);
}

TEE_Result retrieve_property_from_vault(const uint8_t* request, uint8_t* output,
                                        size_t* output_length) {
  const trace_scope scope;
  if (request == nullptr || output == nullptr) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "request %p output %p\n",
                static_cast<const void*>(request), static_cast<const void*>(output));
  }
  if (output_length == nullptr) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "output_length pointer is null\n");
  }
  TEE_Param params[4] = {};
  params[0].memref.buffer = const_cast<uint8_t*>(request);  // an input slot: only read
  params[0].memref.size = REQUEST_SIZE;
  params[1].memref.buffer = output;
  params[1].memref.size = static_cast<tee_size>(*output_length);
  return call_vault(RETRIEVE_PROPERTY, params, output_length);
}

}  // namespace keymaster
