// Devices, prepared commands and operations.
#include "bench/secure_world.h"

#include <filesystem>
#include <stdexcept>
#include <stdlib.h>

#include "tee/device/device.h"
#include "tee/device/uuid.h"

namespace keymaster::bench {
namespace {

constexpr uint32_t TYPES =
    TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE);
// Room for what is put out besides data: a padding block, a tag, a signature, a nonce's parameter.
constexpr size_t SLACK = 2048;
constexpr uint32_t OS_VERSION = 120000;
constexpr uint32_t OS_PATCHLEVEL = 202601;

void expect(const client::status& result, const char* what) {
  if (!result.ok()) throw std::runtime_error(std::string(what) + ": " + result.text());
}

std::string temporary_folder() {
  std::string name = (std::filesystem::temp_directory_path() / "keymaster-bench-XXXXXX").string();
  if (mkdtemp(name.data()) == nullptr) throw std::runtime_error("no temporary folder");
  return name;
}

bytes two_fields(byte_view first, byte_view second) {
  return client::field_writer().field(first).field(second).take();
}

}  // namespace

bytes pattern(size_t length) {
  bytes made(length);
  for (size_t i = 0; i < length; i++)
    made[i] = static_cast<uint8_t>(i * 31 + 7);
  return made;
}

secure_world::secure_world(const std::string& way) : folder_(temporary_folder()) {
  tee::device_settings settings;
  settings.identity = tee::new_uuid();
  settings.rpmb = false;
  device_id_ = settings.identity;
  const std::string path = folder_ + "/device";
  tee::device::create(path, settings);
  const client::context context(way + path);
  session_.emplace(context);
  commands_.emplace(context, client::KEYMASTER_UUID);
  expect(session_->configure(OS_VERSION, OS_PATCHLEVEL), "configure");
}

secure_world::~secure_world() {
  commands_.reset();
  session_.reset();
  std::error_code ignored;
  std::filesystem::remove_all(folder_, ignored);
}

bytes secure_world::import_key(const param_set& description, byte_view key_data) {
  client::key_result made = session_->import_key(description, key_data);
  expect(made, "import_key");
  return std::move(made.blob);
}

bytes secure_world::generate_key(const param_set& description) {
  client::key_result made = session_->generate_key(description);
  expect(made, "generate_key");
  return std::move(made.blob);
}

command::command(secure_world* world, client::command id, bytes input, size_t output_capacity)
    : commands_(&world->commands()),
      id_(static_cast<uint32_t>(id)),
      input_(std::move(input)),
      output_(output_capacity) {}

uint32_t command::run(uint32_t argument) {
  client::parameter_slots slots{};
  slots[0].value.a = argument;
  slots[1].tmpref = {input_.data(), input_.size()};
  slots[2].tmpref = {output_.data(), output_.size()};
  client::status result = commands_->invoke(id_, TYPES, &slots);
  result.error = static_cast<keymaster_error_t>(slots[0].value.a);
  expect(result, "command");
  produced_ = slots[2].tmpref.size;
  return slots[0].value.b;
}

operation::operation(secure_world* world, uint32_t purpose, byte_view blob,
                     const param_set& begin_params, byte_view input, byte_view signature)
    : purpose_(purpose),
      begin_(world, client::command::BEGIN, two_fields(blob, begin_params.marshal()), SLACK),
      update_(world, client::command::UPDATE, two_fields(input, param_set().marshal()),
              input.size() + SLACK),
      finish_(world, client::command::FINISH, two_fields(signature, param_set().marshal()), SLACK) {
}

void operation::run() {
  const uint32_t handle = begin_.run(purpose_);
  update_.run(handle);
  finish_.run(handle);
}

bytes operation::finished() const {
  client::finish_result result;
  client::parse_finished(finish_.output(), &result);
  return std::move(result.output);
}

}  // namespace keymaster::bench
