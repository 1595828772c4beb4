// The test harness: a device in a temporary folder and a Keymaster TA on it, reached through its
// command interface alone. Inputs and outputs lie in heap blocks of exactly their size, sets are
// built by the client library, both clocks stand still until a test moves them, and every command
// is followed by a check that it left nothing behind: heap, objects, operations and sessions are as
// before, apart from what live operations hold.
#pragma once

#include "tee_client_api.h"
#include "tee_extensions.h"

#include <cstdint>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "keymaster/client/authenticator.h"
#include "keymaster/client/session.h"
#include "product/uuids.h"
#include "support/trace_capture.h"
#include "tee/controls/host_control.h"
#include "tee/device/device.h"
#include "tee/device/object_name.h"

namespace keymaster::test {

using client::byte_view;
using client::bytes;
using client::command;
using client::param_set;

// The system that the TA is configured with, and the times at which tests begin.
constexpr uint32_t OS_VERSION = 80100;
constexpr uint32_t OS_PATCHLEVEL = 201812;
constexpr uint64_t START_SYSTEM_MS = 5'000'250;
constexpr uint64_t START_REE_MS = 1'700'000'000'500;

// The identity of the device: the same in every test, so that stored blobs of a device without RPMB
// open for ever.
constexpr TEE_UUID DEVICE_ID = {
    0x00112233, 0x4455, 0x6677, {0x88, 0x99, 0xaa, 0xbb, 0xcc, 0xdd, 0xee, 0xff}};
constexpr TEE_UUID KEYMASTER_TA = KEYMASTER_TA_UUID;

// Where the TA keeps its key storage key on a device with replay-protected storage.
inline const tee::object_name KSK_OBJECT = {
    TEE_STORAGE_RPMB,
    tee::to_bytes(KEYMASTER_TA),
    {'K', 'e', 'y', 'm', 'a', 's', 't', 'e', 'r', ' ', 'K', 'S', 'K', 0}};

// What the output buffer holds before a command.
constexpr uint8_t UNTOUCHED = 0xC3;

// A command as it is sent: the default types are those that its table entry wants.
struct request {
  uint32_t id = 0;
  uint32_t a = 0;
  bytes input = {};
  size_t capacity = 0;  // of the output buffer, if the command has one
  uint32_t b = 0;
  std::optional<uint32_t> types = std::nullopt;
  // How far behind the input's first byte the output starts, when both lie in the same memory.
  std::optional<ptrdiff_t> output_at = std::nullopt;
};

// What came back. A command is done when neither result tells of a failure.
struct reply {
  TEEC_Result res;
  uint32_t origin;
  int32_t km_error;    // slot 0 a
  uint32_t b;          // slot 0 b
  bytes buffer;        // the whole output buffer as the TA left it, `capacity` bytes
  size_t output_size;  // as slot 2 says

  bool ok() const { return res == TEEC_SUCCESS && km_error == KM_ERROR_OK; }
  // The bytes that were produced: the first output_size of the buffer. Empty unless done.
  byte_view output() const;
};

// For EXPECT_TRUE. succeeded: neither result tells of a failure. refused: TEE success and that
// Keymaster error. failed_with: that TEE result.
testing::AssertionResult succeeded(const reply& answer);
testing::AssertionResult refused(const reply& answer, int32_t km_error);
testing::AssertionResult failed_with(const reply& answer, TEEC_Result res);

// finished: the output of an operation's finish; empty unless done.
bytes finished(const reply& answer);

// The requests of the commands, in their layouts. A capacity is large enough unless given.
constexpr size_t AMPLE = 8192;
request configure_request(const param_set& params);
request generate_request(const param_set& description, size_t capacity = AMPLE);
request import_request(const param_set& description, byte_view key_data, size_t capacity = AMPLE);
// For GET_KEY_CHARACTER_SIZE, GET_KEY_CHARACTER and EXPORT_KEY.
request key_request(command id, byte_view blob, const client::application& app = {},
                    size_t capacity = AMPLE);
request upgrade_request(byte_view blob, const param_set& params = {}, size_t capacity = AMPLE);
request begin_request(uint32_t purpose, byte_view blob, const param_set& params = {},
                      size_t capacity = AMPLE);
// For UPDATE and FINISH.
request step_request(command id, uint32_t handle, byte_view input = {},
                     const param_set& params = {}, size_t capacity = AMPLE);
request abort_request(uint32_t handle);
request attest_request(byte_view blob, const param_set& params = {}, size_t capacity = AMPLE);

// bad_key: a description of a key that is not made. Its data: none, and it is generated. The one
// error message that is traced: empty, and there is none.
struct bad_key {
  param_set description;
  int32_t km_error;
  std::string message;
  std::optional<bytes> data = std::nullopt;
};

struct options {
  bool rpmb = true;
  bool configured = true;  // configure after every start
  uint32_t trace_level = TEE_TRACE_INFO;
};

// ta_under_test: one device, and the instance that runs on it. A failed expectation in here is a
// failure of the test.
class ta_under_test {
 public:
  explicit ta_under_test(const options& wanted = {});
  ta_under_test(const ta_under_test&) = delete;
  ta_under_test& operator=(const ta_under_test&) = delete;
  ~ta_under_test();

  // send: one command, with the checks that this file begins with.
  reply send(const request& what);
  // send_well: the same, and it must succeed.
  reply send_well(const request& what);

  // expect_refused: the same, but with TEE success and this error (0: it is done). Unless the line
  // is empty, it is traced.
  reply expect_refused(const request& what, int32_t km_error, const std::string& line = "");
  // expect_refused_keys: each, with its message from "PREFIXgenerate_key" or "PREFIXimport_key".
  // The output is cleared; import_key leaves its size.
  void expect_refused_keys(const std::string& prefix, std::span<const bad_key> keys);

  // fail_each_call: sends what `make` gives with the n-th platform call failing, n = 1, 2, ...,
  // until a command comes to its end without. `check` sees each answer, and whether a call failed.
  void fail_each_call(TEE_Result fault, const std::function<request()>& make,
                      const std::function<void(const reply& answer, bool fired)>& check);

  // Commands with their usual arguments. generate and import expect success and return the blob.
  reply configure(uint32_t os_version, uint32_t os_patchlevel);
  bytes generate(const param_set& description);
  bytes import(const param_set& description, byte_view key_data, size_t capacity = AMPLE);
  // The characteristics of a key whose opening must succeed.
  param_set characteristics(byte_view blob, const client::application& app = {});
  reply begin(uint32_t purpose, byte_view blob, const param_set& params = {});
  // The same, and the operation is aborted if there is one.
  reply try_begin(uint32_t purpose, byte_view blob, const param_set& params);
  // The handle of a begin that must succeed.
  uint32_t begun(uint32_t purpose, byte_view blob, const param_set& params = {});
  reply update(uint32_t handle, byte_view input, const param_set& params = {});
  reply finish(uint32_t handle, byte_view input = {}, const param_set& params = {});
  reply abort(uint32_t handle) { return send(abort_request(handle)); }
  reply upgrade(byte_view blob, const param_set& params = {});
  // begin, update and finish of a use that must succeed; returns the output of both.
  bytes run(uint32_t purpose, byte_view blob, const param_set& params, byte_view input);
  // begin and update, which must succeed, and the answer of finish, which is given `last`.
  reply try_run(uint32_t purpose, byte_view blob, const param_set& params, byte_view input,
                byte_view last = {});

  // A token of the device's authenticator.
  bytes token(const client::token_request& what);

  // stop ends the instance and closes the device; start opens it and a new instance and returns
  // what opening the session returned. restart does both and must succeed, reboot restarts with a
  // new boot of the device: a new seed, while the clocks of the test stay as they are.
  void stop();
  TEEC_Result start();
  void restart();
  void reboot();

  // change_session: opens another session with the instance and closes the one that was used.
  void change_session();

  // advance: moves both clocks forward.
  static void advance(uint64_t ms) { tee::host::advance_clocks(ms); }

  // The trace lines of the last command (or start).
  const trace_capture& trace() const { return trace_; }

  // The device's folder, for tests that change what is stored there while it is stopped.
  const std::string& path() const { return path_; }

  // expect_loading: the next command may take memory that it keeps until the instance ends.
  void expect_loading() { loads_ = true; }

  // watch_secret: from now on no block of TA memory may be freed with these bytes in it.
  void watch_secret(byte_view secret) { secrets_.emplace_back(secret.begin(), secret.end()); }

  size_t live_operations() const { return live_.size(); }

 private:
  tee::host::live_counts counts() const;
  void account(const request& what, const reply& answer, const tee::host::live_counts& before);
  static void inspect_freed(void* self, tee::host::block_stage stage, const uint8_t* block,
                            size_t size);

  options options_;
  std::string path_;
  trace_capture trace_;
  std::vector<bytes> secrets_;
  std::optional<client::context> context_;
  std::unique_ptr<client::connection> session_;
  bool loads_ = false;
  std::map<uint32_t, tee::host::live_counts> live_;  // what each live operation holds
};

}  // namespace keymaster::test
