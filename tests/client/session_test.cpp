// What the client sends, and what it makes of good, failed and hostile answers.
#include "client/session.h"

#include <gtest/gtest.h>

#include "client/authenticator.h"
#include "client/operation.h"
#include "fake_teec.h"

namespace keymaster::client {
namespace {

using fake_teec::answer;
using fake_teec::request;
using fake_teec::requests;

const bytes BLOB = {0xb1, 0x0b};
const param_set VERSION = param_set().add(KM_TAG_OS_VERSION, 7);
constexpr char VERSION_HEX[] = "01000000c10200300000000007000000000000000000000000000000";
constexpr char EMPTY_SET[] = "00000000";
constexpr char MALFORMED_SET[] = "01000000";

void answer_with(const answer& reply) {
  fake_teec::set_handler([reply](const request&) { return reply; });
}

class Session : public testing::Test {
 protected:
  session keymaster{context("")};
};

TEST_F(Session, SendsEachCommandInItsLayout) {
  const std::string version = VERSION_HEX;
  const application app = {{'i', 'd'}, {'d', 'a', 't', 'a'}};
  struct {
    uint32_t command, types, a;
    std::string input;
    std::function<void()> send;
  } cases[] = {
      {13, 0x653, 0, version, [&] { keymaster.generate_key(VERSION); }},
      {14, 0x53, 0, "02000000b10b0200000069640400000064617461",
       [&] { keymaster.get_key_characteristics(BLOB, app); }},
      {16, 0x653, 2, "02000000b10b1c000000" + version, [&] { keymaster.begin(2, BLOB, VERSION); }},
      {17, 0x653, 0xDEADBEEF, "02000000b10b1c000000" + version,
       [&] { keymaster.update(0xDEADBEEF, BLOB, VERSION); }},
      {18, 0x653, 5, "000000000400000000000000", [&] { keymaster.finish(5); }},
      {19, 0x653, 0, "1c000000" + version + "b10b", [&] { keymaster.import_key(VERSION, BLOB); }},
      {20, 0x653, 0, "02000000b10b0000000000000000", [&] { keymaster.export_key(BLOB); }},
      {21, 0x53, 0, "b10b", [&] { keymaster.delete_key(BLOB); }},
      {22, 0x3, 0, "", [&] { keymaster.delete_all_keys(); }},
      {23, 0x3, 9, "", [&] { keymaster.abort(9); }},
      {24, 0x653, 0, "02000000b10b1c000000" + version,
       [&] { keymaster.attest_key(BLOB, VERSION); }},
      {25, 0x53, 0, version, [&] { keymaster.configure(VERSION); }},
      {26, 0x653, 0, "1c000000" + version + "02000000b10b",
       [&] { keymaster.upgrade_key(BLOB, VERSION); }},
  };
  for (const auto& c : cases) {
    answer_with({.a = -33});
    c.send();
    ASSERT_EQ(requests.size(), 1u) << c.command;
    EXPECT_EQ(requests[0].command, c.command);
    EXPECT_EQ(requests[0].types, c.types) << c.command;
    EXPECT_EQ(requests[0].a, c.a) << c.command;
    EXPECT_EQ(to_hex(requests[0].input), c.input) << c.command;
  }
}

TEST_F(Session, TellsTheKeymasterErrorFromAnUntouchedSlot) {
  struct {
    answer reply;
    status expected;
  } cases[] = {
      {{.a = -33}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -33}},
      {{.result = TEEC_ERROR_GENERIC, .a = -1000},
       {TEEC_ERROR_GENERIC, TEEC_ORIGIN_TRUSTED_APP, -1000}},
      {{.result = TEEC_ERROR_TARGET_DEAD, .leave_slots = true},
       {TEEC_ERROR_TARGET_DEAD, TEEC_ORIGIN_TEE, 0}},
  };
  for (const auto& c : cases) {
    answer_with(c.reply);
    update_result result = keymaster.update(0xFFFFFFFE, BLOB);
    EXPECT_EQ(result.text(), c.expected.text());
    EXPECT_TRUE(result.output.empty());
  }
}

TEST_F(Session, RefusesMalformedAnswers) {
  struct {
    const char* what;
    answer reply;
    std::function<status()> send;
  } cases[] = {
      {"a size beyond the capacity", {.output_size = 1 << 20}, [&] { return keymaster.finish(1); }},
      {"an empty blob", {}, [&] { return keymaster.generate_key({}); }},
      {"import: a field too long",
       {.output = {9, 0, 0, 0}},
       [&] { return keymaster.import_key({}, BLOB); }},
      {"import: characteristics missing",
       {.output = from_hex("02000000b10b")},
       [&] { return keymaster.import_key({}, BLOB); }},
      {"finish: bytes left over",
       {.output = from_hex("00000000040000000000000000")},
       [&] { return keymaster.finish(1); }},
      {"finish: no set",
       {.output = from_hex("0000000000000000")},
       [&] { return keymaster.finish(1); }},
      {"characteristics: absurd size",
       {.b = 0xFFFFFFFF},
       [&] { return keymaster.get_key_characteristics(BLOB); }},
      {"update: more consumed than given", {.b = 3}, [&] { return keymaster.update(1, BLOB); }},
      {"begin: no set",
       {.b = 7, .output = from_hex(MALFORMED_SET)},
       [&] { return keymaster.begin(2, BLOB, {}); }},
  };
  for (const auto& c : cases) {
    answer_with(c.reply);
    status result = c.send();
    EXPECT_EQ(result.tee, TEEC_ERROR_BAD_FORMAT) << c.what;
    EXPECT_EQ(result.origin, uint32_t{TEEC_ORIGIN_API}) << c.what;
  }
  // The last one had begun in the TA: the handle goes back.
  EXPECT_EQ(requests.back().command, 23u);
  EXPECT_EQ(requests.back().a, 7u);
}

TEST_F(Session, GrowsOutputsOnlyWhereNothingHappensTwice) {
  fake_teec::set_handler([](const request& sent) {
    bytes blob(100'000, 0xb1);
    if (sent.capacity >= blob.size()) return answer{.output = blob};
    return answer{.result = TEEC_ERROR_SHORT_BUFFER, .output_size = blob.size()};
  });
  EXPECT_EQ(keymaster.generate_key({}).blob.size(), 100'000u);
  EXPECT_EQ(requests.size(), 2u);

  for (int i = 0; i < 3; ++i) {
    answer_with({.result = TEEC_ERROR_SHORT_BUFFER, .output_size = 100'000});
    status result = i == 0   ? status(keymaster.begin(2, BLOB, {}))
                    : i == 1 ? status(keymaster.update(1, BLOB))
                             : status(keymaster.finish(1));
    EXPECT_EQ(result.tee, TEEC_ERROR_SHORT_BUFFER);
    EXPECT_EQ(requests.size(), 1u);
  }
  answer_with({.result = TEEC_ERROR_SHORT_BUFFER, .output_size = 0});
  EXPECT_EQ(keymaster.export_key(BLOB).tee, TEEC_ERROR_SHORT_BUFFER);  // and comes to an end
}

TEST_F(Session, OperationFeedsAllAndAbortsWhatIsNotFinished) {
  fake_teec::set_handler([](const request& sent) {
    if (sent.command == 16) return answer{.b = 3, .output = from_hex(EMPTY_SET)};
    return answer{.b = 2, .output = {'x'}};  // takes two bytes, puts out one
  });
  bytes output;
  {
    operation signing(&keymaster, keymaster.begin(2, BLOB, {}));
    EXPECT_TRUE(signing.update(bytes(6), &output).ok());
    EXPECT_EQ(output, bytes(3, 'x'));
  }
  EXPECT_EQ(requests.size(), 5u);
  EXPECT_EQ(requests.back().command, 23u);
  EXPECT_EQ(requests.back().a, 3u);

  answer_with({.a = -28});
  operation ended(&keymaster, keymaster.begin(2, BLOB, {}));
  EXPECT_EQ(ended.update(BLOB, &output).error, KM_ERROR_INVALID_OPERATION_HANDLE);
  EXPECT_EQ(ended.finish().error, KM_ERROR_INVALID_OPERATION_HANDLE);
  EXPECT_EQ(requests.size(), 1u);

  answer_with({});  // consumes nothing, for ever
  operation stuck(&keymaster, {});
  EXPECT_EQ(stuck.update(BLOB, &output).tee, TEEC_ERROR_BAD_FORMAT);
}

TEST(Authenticator, SendsTheRequestAndWantsAWholeToken) {
  authenticator issuer{context("")};
  answer_with({});
  data_result token = issuer.issue({.user_id = 2, .authenticator_id = 3, .challenge = 1});
  EXPECT_TRUE(token.ok());
  EXPECT_EQ(token.data.size(), AUTH_TOKEN_LENGTH);
  EXPECT_EQ(requests[0].types, 0x65u);
  EXPECT_EQ(to_hex(requests[0].input), "01000000000000000200000000000000030000000000000001000000");
  EXPECT_EQ(requests[0].capacity, AUTH_TOKEN_LENGTH);
}

}  // namespace
}  // namespace keymaster::client
