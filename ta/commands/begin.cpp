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

// The key's binding to its application and its authorisations for this purpose. Both results; an
// operation whose authentication is still due goes on.
TEE_Result authorize(const opened_key& key, uint32_t purpose,
                     const keymaster_key_param_set_t& params, keymaster_error_t* km_error) {
  if (!check_app_id_and_app_data(key.characteristics, unique_blob(params, KM_TAG_APPLICATION_ID),
                                 unique_blob(params, KM_TAG_APPLICATION_DATA))) {
    trace_error("Wrong AppId or AppData");
    *km_error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  const TEE_Result res =
      authorize_begin(key.blob.view(), purpose, params, key.characteristics, km_error);
  if (res == TEE_SUCCESS && *km_error == KM_AUTHENTICATION_DUE) *km_error = KM_ERROR_OK;
  if (failed(res, *km_error)) trace_error("Authorization failed");
  return res;
}

// The method table for this purpose of the key's algorithm.
keymaster_error_t choose_methods(const keymaster_key_param_set_t& characteristics, uint32_t purpose,
                                 const operation_methods_t** methods) {
  const auto* tag = get_unique(characteristics, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    trace_error("No KM_TAG_ALGORITHM");
    return KM_ERROR_UNKNOWN_ERROR;
  }
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm == nullptr || algorithm->get_operation_methods == nullptr) {
    trace_error("Algorithm %d not implemented", static_cast<int>(tag->enumerated));
    return KM_ERROR_UNSUPPORTED_ALGORITHM;
  }
  *methods = algorithm->get_operation_methods(purpose);
  if (*methods != nullptr && (*methods)->create_operation != nullptr) return KM_ERROR_OK;
  trace_error("Algorithm %s purpose %d not implemented", algorithm->name,
              static_cast<int>(purpose));
  return KM_ERROR_UNSUPPORTED_PURPOSE;
}

// Makes the operation object, which takes over the key's characteristics.
keymaster_error_t create(opened_key* key, uint32_t purpose, const keymaster_key_param_set_t& params,
                         keymaster_key_param_set_t* out_params, operation_t** operation) {
  const operation_methods_t* methods = nullptr;
  if (auto error = choose_methods(key->characteristics, purpose, &methods)) return error;
  keymaster_error_t error = KM_ERROR_OK;
  *operation = methods->create_operation(key->material.view(), key->characteristics, params,
                                         out_params, &error);
  if (*operation == nullptr) {
    trace_error("Create operation failed");
    settle_failure(TEE_SUCCESS, &error);
    return error;
  }
  (*operation)->key_characteristics = std::move(key->characteristics);
  return KM_ERROR_OK;
}

// Enters the object in the pool and writes its output parameters. On failure nothing of it is left.
TEE_Result enter(operation_t* operation, const keymaster_key_param_set_t& out_params,
                 command_io* io, keymaster_error_t* km_error) {
  uint32_t handle = 0;
  const TEE_Result added = operation_pool_add(operation, &handle, km_error);
  if (failed(added, *km_error)) {
    trace_error("Allocate in operation pool failed");
    free_ended(operation);
    return added;
  }
  if (TEE_Result res = write_set(out_params, io->output, &io->output_size)) {
    trace_error("Marshal failed");
    end_operation(operation, handle);
    return res;
  }
  io->result = handle;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result begin(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  byte_view blob;
  keymaster_key_param_set_t params;
  if (TEE_Result res = read_use(io->input, &blob, &params)) return res;
  KEYMASTER_DUMP_KEY_PARAM_SET(params);
  opened_key key;
  *km_error = open_checked_key(blob, &key);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  const TEE_Result res = authorize(key, io->argument, params, km_error);
  if (failed(res, *km_error)) return res;

  keymaster_key_param_set_t out_params;
  operation_t* operation = nullptr;
  *km_error = create(&key, io->argument, params, &out_params, &operation);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  return enter(operation, out_params, io, km_error);
}

}  // namespace keymaster::commands
