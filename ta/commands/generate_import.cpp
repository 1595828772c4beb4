// generate_key and import_key.
#include "ta/alg/algorithm.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"
#include "ta/params/dump.h"
#include "ta/store/key_blob.h"

namespace keymaster::commands {
namespace {

keymaster_error_t check_blob_usage(const keymaster_key_param_set_t& description) {
  if (tag_at_most_once(description, KM_TAG_BLOB_USAGE_REQUIREMENTS)) return KM_ERROR_OK;
  trace_error("Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified");
  return KM_ERROR_INVALID_TAG;
}

// The algorithm that an import names, if it can import.
keymaster_error_t choose_import(const keymaster_key_param_set_t& description,
                                const algorithm_t** algorithm) {
  const auto* tag = get_unique(description, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    trace_error("No or too many KM_TAG_ALGORITHM");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  *algorithm = find_algorithm(tag->enumerated);
  if (*algorithm != nullptr && (*algorithm)->import_key != nullptr) return KM_ERROR_OK;
  trace_error("Unsupport import_key for algorithm %s (%d)",
              *algorithm == nullptr ? "" : (*algorithm)->name, static_cast<int>(tag->enumerated));
  return KM_ERROR_UNSUPPORTED_ALGORITHM;
}

// Copies the key data into TA memory and has the algorithm make key material of it.
TEE_Result import_material(const algorithm_t& algorithm, keymaster_key_param_set_t* description,
                           byte_view client_data, heap_buffer* material,
                           keymaster_error_t* km_error) {
  heap_buffer key_data;
  if (!key_data.copy_of(client_data)) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Result res = algorithm.import_key(description, key_data.view(), material, km_error);
  if (failed(res, *km_error)) return res;
  *km_error = check_blob_usage(*description);
  return TEE_SUCCESS;
}

// Writes blob field and characteristics field; *total receives the bytes of both.
TEE_Result write_imported(byte_view material, const keymaster_key_param_set_t& characteristics,
                          byte_span output, size_t* total) {
  const auto too_short = [] {
    trace_error("Too short buffer");
    return TEE_ERROR_GENERIC;
  };
  output_cursor out(output);
  byte_span blob_length;
  byte_span characteristics_length;
  byte_span room;
  if (output.size() < 2 * sizeof(uint32_t) || !out.reserve(sizeof(uint32_t), &blob_length)) {
    return too_short();
  }
  size_t size = 0;
  if (TEE_Result res = save_key(material, characteristics, out.rest(), &size)) {
    trace_error("Can't save key to TEE storage");
    return res;
  }
  store_u32(blob_length, static_cast<uint32_t>(size));
  if (!out.reserve(size, &room) || !out.reserve(sizeof(uint32_t), &characteristics_length)) {
    return too_short();
  }
  if (TEE_Result res = write_set(characteristics, out.rest(), &size)) {
    trace_error("Marshal failed");
    return res;
  }
  store_u32(characteristics_length, static_cast<uint32_t>(size));
  *total = out.written() + size;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result generate_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  keymaster_key_param_set_t description;
  if (TEE_Result res = read_params(io->input, &description)) return res;
  KEYMASTER_DUMP_KEY_PARAM_SET(description);
  const auto* tag = get_unique(description, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    return KM_FAIL(km_error, KM_ERROR_INVALID_ARGUMENT,
                   "No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM");
  }
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm == nullptr || algorithm->generate_key == nullptr) {
    *km_error = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return TEE_SUCCESS;
  }
  heap_buffer material;
  const TEE_Result res = algorithm->generate_key(&description, &material, km_error);
  if (failed(res, *km_error)) return res;
  *km_error = check_blob_usage(description);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  if (TEE_Result saved = save_key(material.view(), description, io->output, &io->output_size)) {
    return TEE_FAIL(saved, "Can't save key to TEE storage");
  }
  return TEE_SUCCESS;
}

TEE_Result import_key(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  input_cursor in(io->input);
  byte_view marshalled;
  if (!in.read_field(&marshalled)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  keymaster_key_param_set_t description;
  if (TEE_Result res = read_params(marshalled, &description)) return res;
  KEYMASTER_DUMP_KEY_PARAM_SET(description);
  const algorithm_t* algorithm = nullptr;
  *km_error = choose_import(description, &algorithm);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer material;
  const TEE_Result res = import_material(*algorithm, &description, in.rest(), &material, km_error);
  if (failed(res, *km_error)) return res;
  return write_imported(material.view(), description, io->output, &io->output_size);
}

}  // namespace keymaster::commands
