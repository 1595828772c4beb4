// What the client sends, and what it makes of good, failed and hostile answers.
#include "client/session.h"

#include <gtest/gtest.h>

#include "client/operation.h"
#include "fake_teec.h"

namespace keymaster::client {
namespace {

using fake_teec::answer;
using fake_teec::request;
using fake_teec::requests;

const bytes BLOB = {0xb1, 0x0b};
constexpr char EMPTY_SET[] = "00000000";
constexpr char MALFORMED_SET[] = "01000000";

void answer_with(const answer& reply) {
  fake_teec::set_handler([reply](const request&) { return reply; });
}

class Session : public testing::Test {
 protected:
  session keymaster{context("")};
};

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

}  // namespace
}  // namespace keymaster::client
