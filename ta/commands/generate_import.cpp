// generate_key and import_key.
#include "ta/alg/algorithm.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"
#include "ta/params/dump.h"

namespace keymaster::commands {
namespace {

keymaster_error_t check_blob_usage(const keymaster_key_param_set_t& description) {
  if (tag_at_most_once(description, KM_TAG_BLOB_USAGE_REQUIREMENTS)) return KM_ERROR_OK;
  return refuse(KM_ERROR_INVALID_TAG, "Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified");
}

// The algorithm that an import names, if it can import.
keymaster_error_t choose_import(const keymaster_key_param_set_t& description,
                                const algorithm_t** algorithm) {
  const auto* tag = get_unique(description, KM_TAG_ALGORITHM);
  if (tag == nullptr) return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_ALGORITHM");
  *algorithm = find_algorithm(tag->enumerated);
  if (*algorithm != nullptr && (*algorithm)->import_key != nullptr) return KM_ERROR_OK;
  return refuse(KM_ERROR_UNSUPPORTED_ALGORITHM, "Unsupport import_key for algorithm %s (%d)",
                *algorithm == nullptr ? "" : (*algorithm)->name, static_cast<int>(tag->enumerated));
}

// Copies the key data into TA memory and has the algorithm make key material of it.
outcome import_material(const algorithm_t& algorithm, keymaster_key_param_set_t* description,
                        byte_view client_data, heap_buffer* material) {
  heap_buffer key_data;
  if (!key_data.copy_of(client_data)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  TRY(algorithm.import_key(description, key_data.view(), material));
  return check_blob_usage(*description);
}

// Writes blob field and characteristics field; *total receives the bytes of both.
TEE_Result write_imported(byte_view material, const keymaster_key_param_set_t& characteristics,
                          byte_span output, size_t* total) {
  output_cursor out(output);
  byte_span blob_length;
  byte_span room;
  if (output.size() < 2 * sizeof(uint32_t) || !out.reserve(sizeof(uint32_t), &blob_length)) {
    return fail(TEE_ERROR_GENERIC, "Too short buffer");
  }
  size_t size = 0;
  TRY(write_blob(material, characteristics, out.rest(), &size));
  store_u32(blob_length, static_cast<uint32_t>(size));
  if (!out.reserve(size, &room)) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  return write_last_set(characteristics, &out, total);
}

}  // namespace

outcome generate_key(command_io* io) {
  const trace_scope scope;
  keymaster_key_param_set_t description;
  TRY(read_params(io->input, &description));
  KEYMASTER_DUMP_KEY_PARAM_SET(description);
  const auto* tag = get_unique(description, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM");
  }
  const algorithm_t* algorithm = find_algorithm(tag->enumerated);
  if (algorithm == nullptr || algorithm->generate_key == nullptr) {
    return KM_ERROR_UNSUPPORTED_ALGORITHM;
  }
  heap_buffer material;
  TRY(algorithm->generate_key(&description, &material));
  TRY(check_blob_usage(description));
  return write_blob(material.view(), description, io->output, &io->output_size);
}

outcome import_key(command_io* io) {
  const trace_scope scope;
  input_cursor in(io->input);
  byte_view marshalled;
  if (!in.read_field(&marshalled)) return fail(TEE_ERROR_GENERIC, "Too short input");
  keymaster_key_param_set_t description;
  TRY(read_params(marshalled, &description));
  KEYMASTER_DUMP_KEY_PARAM_SET(description);
  const algorithm_t* algorithm = nullptr;
  TRY(choose_import(description, &algorithm));
  heap_buffer material;
  TRY(import_material(*algorithm, &description, in.rest(), &material));
  return write_imported(material.view(), description, io->output, &io->output_size);
}

}  // namespace keymaster::commands
