// The SOTER commands, and the layout of what SOTER keys put out.
#include "keymaster/client/soter.h"

namespace keymaster::client {

namespace {

constexpr uint32_t VERIFY_ATTK_KEY_PAIR = 0xFF01;
constexpr uint32_t EXPORT_ATTK_PUBLIC_KEY = 0xFF02;
constexpr uint32_t GET_DEVICE_ID = 0xFF03;

constexpr uint32_t REPORT_MATCH = 1;

constexpr size_t FIRST_CAPACITY = 4096;
constexpr size_t MAX_SOTER_CAPACITY = 64 * 1024;

// What 0xFF02 answers when the SOTER data does not load. The number is a Keymaster error's, too,
// but means none.
constexpr keymaster_error_t DATA_UNAVAILABLE = -1;

}  // namespace

attk_result soter::check_attk() {
  parameter_slots slots{};
  const status outcome = keymaster_->invoke(
      VERIFY_ATTK_KEY_PAIR, TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_NONE, TEEC_NONE, TEEC_NONE),
      &slots);
  if (!outcome.ok()) return {{outcome}};
  const auto state = static_cast<attk_state>(slots[0].value.a);
  if (state == attk_state::READY || state == attk_state::NOT_PROVISIONED ||
      state == attk_state::UNREADABLE) {
    return {{outcome}, state};
  }
  return {{MALFORMED}};
}

// Sends a command that fills slot 2, with more room as long as it asks for that.
soter_result soter::fetch(uint32_t command) {
  for (bytes buffer(FIRST_CAPACITY);; buffer.resize(2 * buffer.size())) {
    parameter_slots slots{};
    slots[2].tmpref = {buffer.data(), buffer.size()};
    soter_result result = {keymaster_->invoke(
        command, TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, TEEC_NONE, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE),
        &slots)};
    if (result.tee == TEEC_SUCCESS) {
      result.error = static_cast<keymaster_error_t>(slots[0].value.a);
    }
    if (result.error == KM_ERROR_INSUFFICIENT_BUFFER_SPACE && buffer.size() < MAX_SOTER_CAPACITY) {
      continue;
    }
    if (!result.ok()) return result;
    if (slots[2].tmpref.size > buffer.size()) return {MALFORMED};
    buffer.resize(slots[2].tmpref.size);
    result.data = std::move(buffer);
    return result;
  }
}

soter_result soter::export_attk() {
  soter_result result = fetch(EXPORT_ATTK_PUBLIC_KEY);
  result.unavailable = result.error == DATA_UNAVAILABLE;
  if (!result.ok()) return result;
  // The text counts the zero byte that ends it.
  if (result.data.empty() || result.data.back() != 0) return {MALFORMED};
  result.data.pop_back();
  return result;
}

soter_result soter::device_id() {
  return fetch(GET_DEVICE_ID);
}

status fingerprint_sensor::report_match(uint32_t fid) {
  parameter_slots slots{};
  slots[0].value.a = fid;
  return connection_.invoke(
      REPORT_MATCH, TEEC_PARAM_TYPES(TEEC_VALUE_INPUT, TEEC_NONE, TEEC_NONE, TEEC_NONE), &slots);
}

std::string_view signed_document::text() const {
  return {reinterpret_cast<const char*>(document.data()), document.size() - 1};
}

signed_document parse_signed_document(byte_view output) {
  field_reader reader(output);
  const byte_view document = reader.field();
  const byte_view signature = reader.raw(reader.left());
  if (document.empty() || document.back() != 0) {
    throw format_error("a document that no zero byte ends");
  }
  if (signature.empty()) throw format_error("a document without a signature");
  return {copy_of(document), copy_of(signature)};
}

}  // namespace keymaster::client
