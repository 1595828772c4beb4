// The commands of the Keymaster trusted application.
#include "keymaster/client/session.h"

#include <algorithm>
#include <utility>

namespace keymaster::client {

namespace {

// Blobs, characteristics and signatures are far smaller; a larger answer is met by doubling.
constexpr size_t OUTPUT_CAPACITY = 16 * 1024;
constexpr size_t MAX_CAPACITY = 16 * 1024 * 1024;

enum class buffers { NONE, INPUT, INPUT_OUTPUT };

buffers buffers_of(command id) {
  switch (id) {
    case command::DELETE_ALL_KEYS:
    case command::ABORT:
      return buffers::NONE;
    case command::GET_KEY_CHARACTER_SIZE:
    case command::DELETE_KEY:
    case command::CONFIGURE:
      return buffers::INPUT;
    default:
      return buffers::INPUT_OUTPUT;
  }
}

uint32_t types_of(buffers kind) {
  switch (kind) {
    case buffers::NONE:
      return TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_NONE, TEEC_NONE, TEEC_NONE);
    case buffers::INPUT:
      return TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, TEEC_NONE, TEEC_NONE);
    default:
      return TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT,
                              TEEC_NONE);
  }
}

TEEC_TempMemoryReference input_reference(byte_view input) {
  // The API's references are not const; an input one is only read.
  return {const_cast<uint8_t*>(input.data()), input.size()};
}

// Reads an answer with `parse`; one that is not in its form leaves no outputs.
template <typename Result, typename Parse>
Result read_answer(const status& outcome, Parse parse) {
  Result result;
  static_cast<status&>(result) = outcome;
  if (!outcome.ok()) return result;
  try {
    parse(&result);
  } catch (const format_error&) {
    result = {};
    static_cast<status&>(result) = MALFORMED;
  }
  return result;
}

bytes copy_blob(byte_view blob) {
  if (blob.empty()) throw format_error("an empty key blob");
  return copy_of(blob);
}

bytes two_fields(byte_view first, byte_view second) {
  size_t length = 2 * sizeof(uint32_t) + first.size() + second.size();
  return field_writer(length).field(first).field(second).take();
}

bytes key_request(byte_view blob, const application& app) {
  return field_writer().field(blob).field(app.id).field(app.data).take();
}

}  // namespace

// What came back: the status with the Keymaster error, slot 0 b, and the output.
struct session::exchange {
  status outcome;
  uint32_t b = 0;
  byte_view output;
  size_t needed = 0;  // the output size that the TA names, also when it did not fit
};

void application::bind(param_set* params) const {
  if (!id.empty()) params->add_bytes(KM_TAG_APPLICATION_ID, id);
  if (!data.empty()) params->add_bytes(KM_TAG_APPLICATION_DATA, data);
}

session::session(context tee, const TEEC_UUID& application)
    : connection_(std::move(tee), application) {}

session::exchange session::call(command id, uint32_t a, byte_view input, size_t capacity) {
  buffers kind = buffers_of(id);
  parameter_slots slots{};
  slots[0].value = {a, 0};
  if (kind != buffers::NONE) slots[1].tmpref = input_reference(input);
  if (kind == buffers::INPUT_OUTPUT) {
    if (output_.size() < capacity) output_.resize(capacity);
    slots[2].tmpref = {output_.data(), capacity};
  }
  exchange result;
  result.outcome = invoke(static_cast<uint32_t>(id), types_of(kind), &slots);
  // A TEE failure from below the TA leaves the slot as it was; that is no Keymaster error.
  uint32_t error = slots[0].value.a;
  if (result.outcome.tee == TEEC_SUCCESS || error != a) {
    result.outcome.error = static_cast<keymaster_error_t>(error);
  }
  result.b = slots[0].value.b;
  if (kind == buffers::INPUT_OUTPUT) {
    result.needed = slots[2].tmpref.size;
    if (result.outcome.ok() && result.needed > capacity) result.outcome = MALFORMED;
    if (result.outcome.ok()) result.output = byte_view(output_).first(result.needed);
  }
  return result;
}

// For commands that change nothing in the TA and can be sent again with more room.
session::exchange session::call_growing(command id, byte_view input) {
  size_t capacity = OUTPUT_CAPACITY;
  exchange result = call(id, 0, input, capacity);
  while (result.outcome.tee == TEEC_ERROR_SHORT_BUFFER && capacity < MAX_CAPACITY) {
    capacity = std::clamp(result.needed, 2 * capacity, MAX_CAPACITY);
    result = call(id, 0, input, capacity);
  }
  return result;
}

key_result session::call_for_blob(command id, byte_view input) {
  exchange answer = call_growing(id, input);
  return read_answer<key_result>(
      answer.outcome, [&](key_result* result) { result->blob = copy_blob(answer.output); });
}

status session::configure(uint32_t os_version, uint32_t os_patchlevel) {
  param_set params;
  params.add(KM_TAG_OS_VERSION, os_version).add(KM_TAG_OS_PATCHLEVEL, os_patchlevel);
  return configure(params);
}

status session::configure(const param_set& params) {
  return call(command::CONFIGURE, 0, params.marshal(), 0).outcome;
}

key_result session::generate_key(const param_set& description) {
  return call_for_blob(command::GENERATE_KEY, description.marshal());
}

key_result session::import_key(const param_set& description, byte_view key_data) {
  bytes input = field_writer().field(description.marshal()).raw(key_data).take();
  exchange answer = call_growing(command::IMPORT_KEY, input);
  return read_answer<key_result>(
      answer.outcome, [&](key_result* result) { parse_imported(answer.output, result); });
}

characteristics_result session::get_key_characteristics(byte_view blob, const application& app) {
  bytes input = key_request(blob, app);
  exchange size = call(command::GET_KEY_CHARACTER_SIZE, 0, input, 0);
  if (size.outcome.ok() && size.b > MAX_CAPACITY) size.outcome = MALFORMED;
  if (!size.outcome.ok()) return {{size.outcome}, {}};
  exchange answer = call(command::GET_KEY_CHARACTER, 0, input, size.b);
  return read_answer<characteristics_result>(answer.outcome, [&](characteristics_result* result) {
    result->characteristics = param_set::parse(answer.output);
  });
}

data_result session::export_key(byte_view blob, const application& app) {
  exchange answer = call_growing(command::EXPORT_KEY, key_request(blob, app));
  return {{answer.outcome}, copy_of(answer.output)};
}

key_result session::upgrade_key(byte_view blob, const param_set& params) {
  return call_for_blob(command::UPGRADE_KEY, two_fields(params.marshal(), blob));
}

status session::delete_key(byte_view blob) {
  return call(command::DELETE_KEY, 0, blob, 0).outcome;
}

status session::delete_all_keys() {
  return call(command::DELETE_ALL_KEYS, 0, {}, 0).outcome;
}

attest_result session::attest_key(byte_view blob, const param_set& params) {
  exchange answer = call_growing(command::ATTEST_KEY, two_fields(blob, params.marshal()));
  return {{answer.outcome}, copy_of(answer.output), answer.b};
}

begin_result session::begin(uint32_t purpose, byte_view blob, const param_set& params) {
  bytes input = two_fields(blob, params.marshal());
  // Never sent twice: a begin that fails late has already counted as a use of the key.
  exchange answer = call(command::BEGIN, purpose, input, OUTPUT_CAPACITY);
  auto result = read_answer<begin_result>(answer.outcome, [&](begin_result* begun) {
    begun->params = param_set::parse(answer.output);
    begun->handle = answer.b;
  });
  if (answer.outcome.ok() && !result.ok()) abort(answer.b);
  return result;
}

update_result session::update(uint32_t handle, byte_view input, const param_set& params) {
  bytes request = two_fields(input, params.marshal());
  // Ciphers put out at most what they held back more than they take in.
  exchange answer = call(command::UPDATE, handle, request, OUTPUT_CAPACITY + input.size());
  return read_answer<update_result>(answer.outcome, [&](update_result* result) {
    if (answer.b > input.size()) throw format_error("more consumed than given");
    result->consumed = answer.b;
    result->output = copy_of(answer.output);
  });
}

finish_result session::finish(uint32_t handle, byte_view input, const param_set& params,
                              size_t room) {
  bytes request = two_fields(input, params.marshal());
  exchange answer = call(command::FINISH, handle, request, OUTPUT_CAPACITY + input.size() + room);
  return read_answer<finish_result>(
      answer.outcome, [&](finish_result* result) { parse_finished(answer.output, result); });
}

status session::abort(uint32_t handle) {
  return call(command::ABORT, handle, {}, 0).outcome;
}

void parse_imported(byte_view answer, key_result* result) {
  field_reader in(answer);
  result->blob = copy_blob(in.field());
  result->characteristics = param_set::parse(in.field());
  in.finish();
}

void parse_finished(byte_view answer, finish_result* result) {
  field_reader in(answer);
  result->output = copy_of(in.field());
  result->params = param_set::parse(in.field());
  in.finish();
}

}  // namespace keymaster::client
