// The commands as the tests send them.
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

request make(command id, bytes input, size_t capacity = 0, uint32_t a = 0) {
  return {.id = static_cast<uint32_t>(id), .a = a, .input = std::move(input), .capacity = capacity};
}

bytes two_fields(byte_view first, byte_view second) {
  return client::field_writer().field(first).field(second).take();
}

}  // namespace

bytes finished(const reply& answer) {
  client::finish_result result;
  if (answer.ok()) client::parse_finished(answer.output(), &result);
  return result.output;
}

request configure_request(const param_set& params) {
  return make(command::CONFIGURE, params.marshal());
}

request generate_request(const param_set& description, size_t capacity) {
  return make(command::GENERATE_KEY, description.marshal(), capacity);
}

request import_request(const param_set& description, byte_view key_data, size_t capacity) {
  return make(command::IMPORT_KEY,
              client::field_writer().field(description.marshal()).raw(key_data).take(), capacity);
}

request key_request(command id, byte_view blob, const client::application& app, size_t capacity) {
  return make(id, client::field_writer().field(blob).field(app.id).field(app.data).take(),
              capacity);
}

request upgrade_request(byte_view blob, const param_set& params, size_t capacity) {
  return make(command::UPGRADE_KEY, two_fields(params.marshal(), blob), capacity);
}

request begin_request(uint32_t purpose, byte_view blob, const param_set& params, size_t capacity) {
  return make(command::BEGIN, two_fields(blob, params.marshal()), capacity, purpose);
}

request step_request(command id, uint32_t handle, byte_view input, const param_set& params,
                     size_t capacity) {
  return make(id, two_fields(input, params.marshal()), capacity, handle);
}

request abort_request(uint32_t handle) {
  return make(command::ABORT, {}, 0, handle);
}

request attest_request(byte_view blob, const param_set& params, size_t capacity) {
  return make(command::ATTEST_KEY, two_fields(blob, params.marshal()), capacity);
}

reply ta_under_test::send_well(const request& what) {
  const reply answer = send(what);
  EXPECT_TRUE(succeeded(answer)) << trace_.errors();
  return answer;
}

reply ta_under_test::expect_refused(const request& what, int32_t km_error,
                                    const std::string& line) {
  reply answer = send(what);
  EXPECT_TRUE(refused(answer, km_error)) << line;
  EXPECT_TRUE(line.empty() || trace_.has(line)) << line << " is not in: " << trace_.errors();
  return answer;
}

void ta_under_test::expect_refused_keys(const std::string& prefix, std::span<const bad_key> keys) {
  for (const auto& [description, km_error, message, data] : keys) {
    const std::string line = prefix + (data ? "import_key: " : "generate_key: ") + message;
    const reply answer = expect_refused(
        data ? import_request(description, *data) : generate_request(description), km_error);
    EXPECT_EQ(trace_.errors(), message.empty() ? "" : line);
    EXPECT_EQ(answer.buffer, bytes(AMPLE)) << line;
    EXPECT_EQ(answer.output_size, data ? AMPLE : 0) << line;
  }
}

reply ta_under_test::configure(uint32_t os_version, uint32_t os_patchlevel) {
  return send(configure_request(
      param_set().add(KM_TAG_OS_VERSION, os_version).add(KM_TAG_OS_PATCHLEVEL, os_patchlevel)));
}

bytes ta_under_test::generate(const param_set& description) {
  return client::copy_of(send_well(generate_request(description)).output());
}

bytes ta_under_test::import(const param_set& description, byte_view key_data, size_t capacity) {
  const reply answer = send_well(import_request(description, key_data, capacity));
  client::key_result imported;
  if (answer.ok()) client::parse_imported(answer.output(), &imported);
  return imported.blob;
}

param_set ta_under_test::characteristics(byte_view blob, const client::application& app) {
  const reply answer = send_well(key_request(command::GET_KEY_CHARACTER, blob, app));
  return answer.ok() ? param_set::parse(answer.output()) : param_set();
}

reply ta_under_test::begin(uint32_t purpose, byte_view blob, const param_set& params) {
  return send(begin_request(purpose, blob, params));
}

reply ta_under_test::try_begin(uint32_t purpose, byte_view blob, const param_set& params) {
  const reply answer = begin(purpose, blob, params);
  if (answer.ok()) abort(answer.b);
  return answer;
}

uint32_t ta_under_test::begun(uint32_t purpose, byte_view blob, const param_set& params) {
  return send_well(begin_request(purpose, blob, params)).b;
}

reply ta_under_test::update(uint32_t handle, byte_view input, const param_set& params) {
  return send(step_request(command::UPDATE, handle, input, params, input.size() + AMPLE));
}

reply ta_under_test::finish(uint32_t handle, byte_view input, const param_set& params) {
  return send(step_request(command::FINISH, handle, input, params));
}

reply ta_under_test::upgrade(byte_view blob, const param_set& params) {
  return send(upgrade_request(blob, params));
}

bytes ta_under_test::run(uint32_t purpose, byte_view blob, const param_set& params,
                         byte_view input) {
  const uint32_t handle = begun(purpose, blob, params);
  const reply updated =
      send_well(step_request(command::UPDATE, handle, input, {}, input.size() + AMPLE));
  EXPECT_EQ(updated.b, input.size());
  bytes output = client::copy_of(updated.output());
  client::append(&output, finished(send_well(step_request(command::FINISH, handle))));
  return output;
}

reply ta_under_test::try_run(uint32_t purpose, byte_view blob, const param_set& params,
                             byte_view input, byte_view last) {
  const uint32_t handle = begun(purpose, blob, params);
  EXPECT_TRUE(succeeded(update(handle, input))) << trace_.errors();
  return finish(handle, last);
}

}  // namespace keymaster::test
