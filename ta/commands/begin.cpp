// begin: opens a key, authorises its use and makes an operation.
#include "ta/alg/algorithm.h"
#include "ta/auth/authorization.h"
#include "ta/auth/operation_pool.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"
#include "ta/commands/operation_end.h"
#include "ta/params/dump.h"

namespace keymaster::commands {
namespace {

// The key's binding to its application and its authorisations for this purpose. An operation whose
// authentication is still due goes on.
outcome authorize(const opened_key& key, uint32_t purpose,
                  const keymaster_key_param_set_t& params) {
  TRY(check_application(key.characteristics, unique_blob(params, KM_TAG_APPLICATION_ID),
                        unique_blob(params, KM_TAG_APPLICATION_DATA)));
  const outcome how = authorize_begin(key.blob.view(), purpose, params, key.characteristics);
  if (how.tee == TEE_SUCCESS && how.error == KM_AUTHENTICATION_DUE) return DONE;
  if (failed(how)) trace(TEE_TRACE_ERROR, "Authorization failed");
  return how;
}

// Makes the operation object, which takes over the key's characteristics.
keymaster_error_t create(opened_key* key, uint32_t purpose, const keymaster_key_param_set_t& params,
                         keymaster_key_param_set_t* out_params, operation_t** operation) {
  const algorithm_t* algorithm = nullptr;
  TRY(operating_algorithm(key->characteristics, &algorithm));
  const operation_methods_t* methods = algorithm->get_operation_methods(purpose);
  if (methods == nullptr || methods->create_operation == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_PURPOSE, "Algorithm %s purpose %d not implemented",
                  algorithm->name, static_cast<int>(purpose));
  }
  if (auto error = methods->create_operation(
          {key->material.view(), key->characteristics, params, out_params}, operation)) {
    return refuse(error, "Create operation failed");
  }
  (*operation)->key_characteristics = std::move(key->characteristics);
  return KM_ERROR_OK;
}

// Enters the object in the pool and writes its output parameters. On failure nothing of it is left.
outcome enter(operation_t* operation, const keymaster_key_param_set_t& out_params, command_io* io) {
  uint32_t handle = 0;
  if (auto error = operation_pool_add(operation, &handle)) {
    trace(TEE_TRACE_ERROR, "Allocate in operation pool failed");
    free_ended(operation);
    return error;
  }
  if (TEE_Result res = write_set(out_params, io->output, &io->output_size)) {
    end_operation(operation, handle);
    return res;
  }
  io->result = handle;
  return DONE;
}

}  // namespace

outcome begin(command_io* io) {
  const trace_scope scope;
  byte_view blob;
  keymaster_key_param_set_t params;
  TRY(read_use(io->input, &blob, &params));
  KEYMASTER_DUMP_KEY_PARAM_SET(params);
  opened_key key;
  TRY(open_checked_key(blob, &key));
  TRY(authorize(key, io->argument, params));

  keymaster_key_param_set_t out_params;
  operation_t* operation = nullptr;
  TRY(create(&key, io->argument, params, &out_params, &operation));
  return enter(operation, out_params, io);
}

}  // namespace keymaster::commands
