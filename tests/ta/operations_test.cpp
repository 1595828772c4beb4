// begin, update, finish and _abort: what each refuses, and what ends an operation.
#include <gtest/gtest.h>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::to_hex;

constexpr uint32_t SIGN = KM_PURPOSE_SIGN;
constexpr char RFC_4231_CASE_1[] =
    "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7";

class Operations : public testing::Test {
 protected:
  ta_under_test ta;
  bytes blob = ta.import(hmac_key(), bytes(20, 0x0b));
};

TEST_F(Operations, BeginLeavesNoOperationWhenItFails) {
  bytes garbage = begin_request(SIGN, blob, mac_use()).input;
  garbage[4 + blob.size() + 4] = 3;  // announces one parameter more than there is
  const struct {
    const char* what;
    request begin;
    TEEC_Result res;
    int32_t error;
    const char* errors;
  } cases[] = {
      {"parameters",
       {.id = 16, .a = SIGN, .input = garbage, .capacity = 64},
       0xFFFF0006,
       0,
       "unmarshal: Too short input | begin: Unmarshal failed"},
      {"purpose without table", begin_request(0, blob, mac_use()), 0, -2,
       "begin: Algorithm HMAC purpose 0 not implemented | begin: Authorization failed"},
      {"purpose beyond 3", begin_request(4, blob, mac_use()), 0, -2,
       "begin: Algorithm HMAC purpose 4 not implemented | begin: Authorization failed"},
      {"purpose beyond sign", begin_request(0xFFFFFFFF, blob, mac_use()), 0, -2,
       "begin: Algorithm HMAC purpose -1 not implemented | begin: Authorization failed"},
      {"object", begin_request(SIGN, blob, one(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)), 0, -38,
       "create_hmac_sign: No or too many KM_TAG_MAC_LENGTH | begin: Create operation failed"},
      {"output", begin_request(SIGN, blob, mac_use(), 3), 0xFFFF0010, 0,
       "marshal: Too short marshalling buffer | begin: Marshal failed"},
      {"no output", begin_request(SIGN, blob, mac_use(), 0), 0xFFFF0010, 0,
       "marshal: Too short marshalling buffer | begin: Marshal failed"},
  };
  for (int round = 0; round < 3; round++) {  // 21 in all: more than the pool holds
    for (const auto& c : cases) {
      const reply answer = ta.send(c.begin);
      EXPECT_TRUE(failed_with(answer, c.res)) << c.what;
      EXPECT_EQ(answer.km_error, c.error) << c.what;
      EXPECT_EQ(ta.trace().errors(), c.errors);
      EXPECT_EQ(answer.output_size, 0u) << c.what;
      EXPECT_TRUE(refused(ta.abort(answer.b), KM_ERROR_INVALID_OPERATION_HANDLE)) << c.what;
    }
  }
}

TEST_F(Operations, UnknownHandlesAreRefused) {
  const uint32_t ended = ta.begun(SIGN, blob, mac_use());
  EXPECT_TRUE(succeeded(ta.abort(ended)));
  const uint32_t live = ta.begun(SIGN, blob, mac_use());
  for (const uint32_t handle : {0u, ended, ~live}) {
    for (const reply& answer : {ta.update(handle, as_bytes("data")), ta.finish(handle),
                                ta.send({.id = 17, .a = handle, .input = {1}}), ta.abort(handle)}) {
      EXPECT_TRUE(refused(answer, KM_ERROR_INVALID_OPERATION_HANDLE));
      EXPECT_EQ(answer.b, 0u);
    }
    EXPECT_TRUE(ta.trace().has("operation_pool_get: Operation handle not found"));
  }
}

// A client cannot try again: whatever update or finish fails for, the operation is over.
TEST_F(Operations, AnyFailedStepEndsThem) {
  const bytes no_set = {1, 0, 0, 0, 9, 2, 0, 0, 0, 0, 0};
  const bytes cut_data = {9, 0, 0, 0, 1, 2, 3};
  const bytes cut_set = {5, 0, 0, 0, 1, 2, 3, 4, 5, 9, 0, 0, 0};
  const bytes good = step_request(command::FINISH, 0).input;
  const struct {
    command id;
    bytes input;
    size_t capacity;
    TEEC_Result res;
    int32_t error;
    uint32_t b;
    const char* errors;
  } cases[] = {
      {command::UPDATE, cut_data, 64, 0xFFFF0000, 0, 0, "update: Too short input"},
      {command::UPDATE, cut_set, 64, 0xFFFF0000, 0, 5, "update: Too short input"},
      {command::UPDATE, no_set, 64, 0, -38, 1,
       "unmarshal: Too short input | update: Unmarshal failed"},
      {command::FINISH, cut_data, 64, 0xFFFF0000, 0, 0, "finish: Too short input"},
      {command::FINISH, no_set, 64, 0, -38, 0,
       "unmarshal: Too short input | finish: Unmarshal failed"},
      {command::FINISH, good, 3, 0xFFFF0000, 0, 0, "finish: Too short buffer"},
      {command::FINISH, good, 39, 0xFFFF0000, 0, 0, "finish: Too short buffer"},
      {command::FINISH, good, 43, 0xFFFF0010, 0, 0,
       "marshal: Too short marshalling buffer | finish: Marshal failed"},
  };
  for (const auto& c : cases) {
    const uint32_t handle = ta.begun(SIGN, blob, mac_use());
    const reply answer = ta.send(
        {.id = static_cast<uint32_t>(c.id), .a = handle, .input = c.input, .capacity = c.capacity});
    EXPECT_TRUE(failed_with(answer, c.res)) << c.errors;
    EXPECT_EQ(answer.km_error, c.error) << c.errors;
    EXPECT_EQ(answer.b, c.b) << c.errors;
    EXPECT_EQ(answer.output_size, 0u);
    EXPECT_EQ(ta.trace().errors(), c.errors);
    EXPECT_TRUE(refused(ta.finish(handle), KM_ERROR_INVALID_OPERATION_HANDLE)) << c.errors;
  }
}

TEST_F(Operations, AbortEndsThemOnce) {
  const uint32_t handle = ta.begun(SIGN, blob, mac_use());
  EXPECT_TRUE(succeeded(ta.abort(handle)));
  EXPECT_TRUE(refused(ta.abort(handle), KM_ERROR_INVALID_OPERATION_HANDLE));
}

// Sessions carry no state, and the key is the one that begin opened.
TEST_F(Operations, OutliveTheirSessionAndAConfigure) {
  const uint32_t handle = ta.begun(SIGN, blob, mac_use());
  EXPECT_TRUE(succeeded(ta.update(handle, as_bytes("Hi "))));
  ta.change_session();
  ta.configure(OS_VERSION + 1, OS_PATCHLEVEL);
  EXPECT_TRUE(succeeded(ta.update(handle, as_bytes("There"))));
  EXPECT_EQ(to_hex(ta.finish(handle).output()).substr(8, 64), RFC_4231_CASE_1);
}

TEST_F(Operations, AreGoneWithTheirInstance) {
  const uint32_t handle = ta.begun(SIGN, blob, mac_use());
  ta.restart();
  EXPECT_TRUE(refused(ta.abort(handle), KM_ERROR_INVALID_OPERATION_HANDLE));
}

TEST(OperationsOf, BlobsWithoutAnAlgorithm) {
  ta_under_test ta({.rpmb = false});
  const bytes record = hmac_material(bytes(20, 0x0b));
  const param_set made = ta.characteristics(ta.generate(hmac_key(256)));
  const param_set none = without(made, KM_TAG_ALGORITHM);
  const bytes nameless = seal(blob_plaintext(record, none));
  EXPECT_TRUE(refused(ta.begin(SIGN, nameless, mac_use()), -33));
  EXPECT_TRUE(refused(ta.send(key_request(command::EXPORT_KEY, nameless)), -38));
  const param_set unknown = param_set(none).append(one(KM_TAG_ALGORITHM, 2));
  EXPECT_TRUE(refused(ta.begin(SIGN, seal(blob_plaintext(record, unknown)), mac_use()), -4));
  EXPECT_TRUE(ta.trace().has("begin: Algorithm 2 not implemented"));
}

}  // namespace
}  // namespace keymaster::test
