// begin, update, finish and _abort: what each refuses, and what ends an operation.
#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_folders.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

class Operations : public testing::Test {
 protected:
  uint32_t begun() { return ta.begun(SIGN, blob, mac_use()); }
  void expect_gone(uint32_t handle) {
    EXPECT_TRUE(refused(ta.finish(handle), KM_ERROR_INVALID_OPERATION_HANDLE));
  }

  ta_under_test ta{{.rpmb = false}};
  const bytes blob = ta.import(hmac_key(), bytes(20, 0x0b));
};

TEST_F(Operations, BeginLeavesNoOperationWhenItFails) {
  request garbage = begin_request(SIGN, blob, mac_use());
  garbage.input[4 + blob.size() + 4] = 3;  // announces one parameter more than there is
  const param_set made = ta.characteristics(blob);
  const bytes record = hmac_material(bytes(20, 0x0b));
  const bytes sha1 = seal(blob_plaintext(hmac_material(bytes(20, 0x0b), 0xA0000001), made));
  const bytes cut = seal(blob_plaintext(byte_view(record).first(record.size() - 1), made));
  const bytes none = seal(blob_plaintext(record, without(made, KM_TAG_ALGORITHM)));
  const bytes unknown = seal(blob_plaintext(record, with(made, KM_TAG_ALGORITHM, {2})));
  const std::string unauthorized = " | begin: Authorization failed";
  const std::string refused = " not implemented" + unauthorized;
  const std::string not_created = " | begin: Create operation failed";
  const std::string no_length = "create_hmac_sign: No or too many KM_TAG_MAC_LENGTH" + not_created;
  const std::string no_key = "create_hmac_sign: Resolve key data failed" + not_created;
  const std::string no_room = "marshal: Too short marshalling buffer | begin: Marshal failed";
  const std::tuple<request, TEEC_Result, int32_t, std::string> cases[] = {
      {garbage, 0xFFFF0006, 0, "unmarshal: Too short input | begin: Unmarshal failed"},
      {begin_request(0, blob, mac_use()), 0, -2, "begin: Algorithm HMAC purpose 0" + refused},
      {begin_request(4, blob, mac_use()), 0, -2, "begin: Algorithm HMAC purpose 4" + refused},
      {begin_request(~0u, blob, mac_use()), 0, -2, "begin: Algorithm HMAC purpose -1" + refused},
      {begin_request(SIGN, none, mac_use()), 0, -33,
       "authorize_begin: No or too many KM_TAG_ALGORITHM in key_params" + unauthorized},
      {begin_request(SIGN, unknown, mac_use()), 0, -4, "begin: Algorithm 2" + refused},
      {begin_request(SIGN, blob, one(KM_TAG_DIGEST, 4)), 0, -38, no_length},
      {begin_request(SIGN, blob, mac_use().add(KM_TAG_MAC_LENGTH, 64)), 0, -38, no_length},
      {begin_request(SIGN, sha1, mac_use()), 0, -41, no_key},
      {begin_request(SIGN, cut, mac_use()), 0, -1000,
       "hmac_resolve_key_data: Too short input | " + no_key},
      {begin_request(SIGN, blob, mac_use(), 3), 0xFFFF0010, 0, no_room},
      {begin_request(SIGN, blob, mac_use(), 0), 0xFFFF0010, 0, no_room},
  };
  for (int round = 0; round < 2; round++) {  // 24 in all: more than the pool holds
    for (const auto& [begin, res, error, errors] : cases) {
      const reply answer = ta.send(begin);
      EXPECT_TRUE(failed_with(answer, res)) << errors;
      EXPECT_EQ(answer.km_error, error) << errors;
      EXPECT_EQ(ta.trace().errors(), errors);
      expect_gone(answer.b);
    }
  }
  // Keys of no algorithm, or of one that nothing knows, are not exported or attested, either.
  ta.expect_refused(key_request(command::EXPORT_KEY, none), -38,
                    "export_key: No or too many KM_TAG_ALGORITHM");
  ta.expect_refused(key_request(command::EXPORT_KEY, unknown), -4,
                    "export_key: Unsupported algorithm");
  ta.expect_refused(attest_request(none), -1000, "attest_key: No KM_TAG_ALGORITHM");
  ta.expect_refused(attest_request(unknown), -4, "attest_key: Algorithm 2 not implemented");
}

TEST_F(Operations, UnknownHandlesAreRefused) {
  const uint32_t ended = begun();
  EXPECT_TRUE(succeeded(ta.abort(ended)));
  for (const uint32_t handle : {0u, ended, ~begun()}) {
    for (const command id : {command::UPDATE, command::FINISH, command::ABORT}) {
      // Whose input would be refused, too.
      const reply answer = ta.send({.id = static_cast<uint32_t>(id), .a = handle, .input = {1}});
      EXPECT_TRUE(refused(answer, KM_ERROR_INVALID_OPERATION_HANDLE));
      EXPECT_EQ(answer.b, 0u);
      EXPECT_EQ(ta.trace().errors(), "operation_pool_get: Operation handle not found");
    }
  }
}

// A client cannot try again: whatever update or finish fails for, the operation is over.
TEST_F(Operations, AnyFailedStepEndsThem) {
  const bytes no_set = {1, 0, 0, 0, 9, 2, 0, 0, 0, 0, 0};
  const bytes cut_data = {9, 0, 0, 0, 1, 2, 3};
  const bytes cut_set = {5, 0, 0, 0, 1, 2, 3, 4, 5, 9, 0, 0, 0};
  const bytes good = step_request(command::FINISH, 0).input;
  const struct {
    uint32_t id;
    bytes input;
    size_t capacity;
    TEEC_Result res;
    int32_t error;
    uint32_t b;
    const char* errors;
  } cases[] = {
      {17, cut_data, 64, 0xFFFF0000, 0, 0, "update: Too short input"},
      {17, cut_set, 64, 0xFFFF0000, 0, 5, "update: Too short input"},
      {17, no_set, 64, 0, -38, 1, "unmarshal: Too short input | update: Unmarshal failed"},
      {18, cut_data, 64, 0xFFFF0000, 0, 0, "finish: Too short input"},
      {18, no_set, 64, 0, -38, 0, "unmarshal: Too short input | finish: Unmarshal failed"},
      {18, good, 3, 0xFFFF0000, 0, 0, "finish: Too short buffer"},
      {18, good, 39, 0xFFFF0000, 0, 0, "finish: Too short buffer"},
      {18, good, 43, 0xFFFF0010, 0, 0,
       "marshal: Too short marshalling buffer | finish: Marshal failed"},
  };
  for (const auto& c : cases) {
    const uint32_t handle = begun();
    const reply answer =
        ta.send({.id = c.id, .a = handle, .input = c.input, .capacity = c.capacity});
    EXPECT_TRUE(failed_with(answer, c.res)) << c.errors;
    EXPECT_EQ(answer.km_error, c.error) << c.errors;
    EXPECT_EQ(answer.b, c.b) << c.errors;
    EXPECT_EQ(ta.trace().errors(), c.errors);
    expect_gone(handle);
  }
}

// Sessions carry no state, and the key is the one that begin opened.
TEST_F(Operations, OutliveTheirSessionAndAConfigureButNotTheirInstance) {
  const uint32_t handle = begun();
  EXPECT_TRUE(succeeded(ta.update(handle, as_bytes("Hi "))));
  ta.change_session();
  ta.configure(OS_VERSION + 1, OS_PATCHLEVEL);
  EXPECT_TRUE(succeeded(ta.update(handle, as_bytes("There"))));
  EXPECT_EQ(client::to_hex(ta.finish(handle).output()).substr(8, 64),
            "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7");
  ta.configure(OS_VERSION, OS_PATCHLEVEL);
  const uint32_t lost = begun();
  ta.restart();
  expect_gone(lost);
}

TEST_F(Operations, OutliveAnotherTrustedApplicationThatDies) {
  constexpr TEEC_UUID FAULTY = {0x1f3c5e70, 0x0010, 0x4a00, {0x80, 0, 0, 0, 0, 0, 0, 1}};
  constexpr uint32_t PANIC = 3;
  const uint32_t handle = begun();
  client::parameter_slots slots{};
  use_ta_folders(TEST_TA_PATH);
  tee::host::end_process_on_panic(false);
  client::connection other(client::context(ta.path()), FAULTY);
  EXPECT_EQ(other.invoke(PANIC, TEEC_VALUE_INPUT, &slots).tee, TEEC_ERROR_TARGET_DEAD);
  tee::host::end_process_on_panic(true);
  use_own_tas();
  EXPECT_TRUE(succeeded(ta.finish(handle, as_bytes("Hi There"))));
}

}  // namespace
}  // namespace keymaster::test
