// What the client makes of good, failed and hostile answers and of the documents in them.
#include "keymaster/client/session.h"

#include <gtest/gtest.h>

#include "fake_teec.h"
#include "keymaster/client/operation.h"
#include "keymaster/client/soter.h"

namespace keymaster::client {
namespace {

using fake_teec::answer;
using fake_teec::answer_with;
using fake_teec::request;
using fake_teec::requests;

const bytes BLOB = {0xb1, 0x0b};

class Session : public testing::Test {
 protected:
  session keymaster{context("")};
};

TEST_F(Session, TellsTheKeymasterErrorFromAnUntouchedSlot) {
  const std::pair<answer, status> cases[] = {
      {{.a = -33}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -33}},
      {{.result = TEEC_ERROR_GENERIC, .a = -1000},
       {TEEC_ERROR_GENERIC, TEEC_ORIGIN_TRUSTED_APP, -1000}},
      {{.result = TEEC_ERROR_TARGET_DEAD, .leave_slots = true},
       {TEEC_ERROR_TARGET_DEAD, TEEC_ORIGIN_TEE, 0}},
  };
  for (const auto& [reply, expected] : cases) {
    answer_with(reply);
    update_result result = keymaster.update(0xFFFFFFFE, BLOB);
    EXPECT_EQ(result.text(), expected.text());
    EXPECT_TRUE(result.output.empty());
  }
}

TEST_F(Session, RefusesMalformedAnswers) {
  const auto import = [&] { return keymaster.import_key({}, BLOB); };
  const auto finish = [&] { return keymaster.finish(1); };
  const std::tuple<const char*, answer, std::function<status()>> cases[] = {
      {"an empty blob", {}, [&] { return keymaster.generate_key({}); }},
      {"a field too long", {.output = {9, 0, 0, 0}}, import},
      {"characteristics missing", {.output = from_hex("02000000b10b")}, import},
      {"a size beyond the capacity", {.output_size = 1 << 20}, finish},
      {"an output beyond the capacity",
       {.output_size = 1 << 20},
       [&] { return keymaster.export_key(BLOB); }},
      {"bytes left over", {.output = from_hex("00000000040000000000000000")}, finish},
      {"no set to finish", {.output = from_hex("0000000000000000")}, finish},
      {"absurd size", {.b = ~0u}, [&] { return keymaster.get_key_characteristics(BLOB); }},
      {"more consumed than given", {.b = 3}, [&] { return keymaster.update(1, BLOB); }},
      {"a malformed set",
       {.b = 7, .output = from_hex("01000000")},
       [&] { return keymaster.begin(2, BLOB, {}); }},
  };
  for (const auto& [what, reply, send] : cases) {
    answer_with(reply);
    EXPECT_EQ(send().text(), status({TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}).text()) << what;
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

  answer_with({.result = TEEC_ERROR_SHORT_BUFFER, .output_size = 100'000});
  EXPECT_EQ(keymaster.begin(2, BLOB, {}).tee, TEEC_ERROR_SHORT_BUFFER);
  EXPECT_EQ(keymaster.update(1, BLOB).tee, TEEC_ERROR_SHORT_BUFFER);
  EXPECT_EQ(keymaster.finish(1).tee, TEEC_ERROR_SHORT_BUFFER);
  EXPECT_EQ(requests.size(), 3u);
  answer_with({.result = TEEC_ERROR_SHORT_BUFFER, .output_size = 0});
  EXPECT_EQ(keymaster.export_key(BLOB).tee, TEEC_ERROR_SHORT_BUFFER);  // and comes to an end
}

TEST_F(Session, OperationFeedsAllAndAbortsWhatIsNotFinished) {
  fake_teec::set_handler([](const request& sent) {
    if (sent.command == 16) return answer{.b = 3, .output = bytes(4)};
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

class Soter : public Session {
 protected:
  soter commands{&keymaster};
};

TEST_F(Soter, ReadsOutputsAndRefusesMalformedOnes) {
  const std::tuple<answer, status, bool> rows[] = {
      {{.output = {'P', 0}}, {}, false},
      {{.a = -1}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -1}, true},
      {{.a = -1000}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -1000}, false},
      {{.output = {'P'}}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
      {{.output = {}}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
      {{.output_size = 1 << 20}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
  };
  for (const auto& [reply, expected, unavailable] : rows) {
    answer_with(reply);
    const soter_result exported = commands.export_attk();
    EXPECT_EQ(exported.text(), expected.text());
    EXPECT_EQ(exported.unavailable, unavailable);
    EXPECT_EQ(exported.data, expected.ok() ? bytes{'P'} : bytes{});
    EXPECT_EQ(requests[0].types, 0x602u);
  }
}

TEST_F(Soter, AsksAgainWithMoreRoomUntilThatIsAbsurd) {
  fake_teec::set_handler([](const request& sent) {
    const bytes id(10'000, 'd');
    return sent.capacity < id.size() ? answer{.a = -29} : answer{.output = id};
  });
  EXPECT_EQ(commands.device_id().data.size(), 10'000u);
  EXPECT_EQ(requests.size(), 3u);
  answer_with({.a = -29});
  EXPECT_EQ(commands.device_id().error, KM_ERROR_INSUFFICIENT_BUFFER_SPACE);
}

TEST(SignedDocument, IsTakenApartOrRefused) {
  const signed_document good = parse_signed_document(from_hex("030000007b7d00aabb"));
  EXPECT_EQ(good.text(), "{}");
  EXPECT_EQ(to_hex(good.document), "7b7d00");
  EXPECT_EQ(to_hex(good.signature), "aabb");
  for (const char* bad : {"", "03000000", "040000007b7d00", "ffffffff7b7d00aa", "030000007b7d00",
                          "020000007b7daabb", "00000000aabb"}) {
    EXPECT_THROW(parse_signed_document(from_hex(bad)), format_error) << bad;
  }
}

}  // namespace
}  // namespace keymaster::client
