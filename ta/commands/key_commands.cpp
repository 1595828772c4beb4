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

// Reads the request of the two characteristics commands and opens its key.
outcome open_for_characteristics(byte_view input, opened_key* key) {
  key_request request;
  if (!read_key_request(input, &request)) return fail(TEE_ERROR_GENERIC, "Too short input");
  if (request.blob.size() < SHORTEST_BLOB) {
    return refuse(KM_ERROR_INVALID_KEY_BLOB, "Wrong key_blob_size %d",
                  static_cast<int>(request.blob.size()));
  }
  return open_requested_key(request, key);
}

outcome export_normal(const opened_key& key, command_io* io) {
  const auto* tag = get_unique(key.characteristics, KM_TAG_ALGORITHM);
  if (tag == nullptr) return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_ALGORITHM");
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm == nullptr || algorithm->export_key == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_ALGORITHM, "Unsupported algorithm");
  }
  const outcome how = algorithm->export_key(key.material.view(), io->output, &io->output_size);
  if (failed(how)) trace(TEE_TRACE_ERROR, "Export key failed");
  return how;
}

}  // namespace

outcome get_key_character_size(command_io* io) {
  const trace_scope scope;
  opened_key key;
  TRY(open_for_characteristics(io->input, &key));
  io->result = marshal_size(key.characteristics, false);
  return DONE;
}

outcome get_key_character(command_io* io) {
  const trace_scope scope;
  opened_key key;
  TRY(open_for_characteristics(io->input, &key));
  return write_set(key.characteristics, io->output, &io->output_size);
}

outcome export_key(command_io* io) {
  const trace_scope scope;
  key_request request;
  if (!read_key_request(io->input, &request)) return fail(TEE_ERROR_GENERIC, "Too short input");
  opened_key key;
  TRY(open_requested_key(request, &key));
  if (!contains_tag(key.characteristics, KM_TAG_SOTER_KEY)) {
    trace(TEE_TRACE_DEBUG, "normal export_key\n");
    return export_normal(key, io);
  }
  trace(TEE_TRACE_DEBUG, "soter export_key\n");
  if (soter_enhance_export_key(key.characteristics, key.material.view(), io->output,
                               &io->output_size) != TEE_SUCCESS) {
    trace(TEE_TRACE_ERROR, "Export key failed");
  }
  return DONE;  // whatever that export did: intended, clients look at the output alone
}

// Keys live in their blobs alone: there is nothing to erase.
outcome delete_key(command_io* io) {
  const trace_scope scope;
  if (io->input.size() >= SHORTEST_BLOB) return DONE;
  return refuse(KM_ERROR_INVALID_KEY_BLOB, "Keystore delete key failed");
}

outcome delete_all_key(command_io*) {
  return DONE;
}

outcome configure(command_io* io) {
  const trace_scope scope;
  keymaster_key_param_set_t set;
  TRY(read_params(io->input, &set));
  configured_set(set);
  return DONE;
}

}  // namespace keymaster::commands
