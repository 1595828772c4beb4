// The SOTER commands, their siblings' commands, and the documents that come back.
#include "client/soter.h"

#include <gtest/gtest.h>

#include "fake_teec.h"

namespace keymaster::client {
namespace {

using fake_teec::answer;
using fake_teec::request;
using fake_teec::requests;

void answer_with(const answer& reply) {
  fake_teec::set_handler([reply](const request&) { return reply; });
}

class Soter : public testing::Test {
 protected:
  session keymaster{context("")};
  soter commands{&keymaster};
};

TEST_F(Soter, ReadsOutputsAndRefusesMalformedOnes) {
  const struct {
    answer reply;
    status expected;
    bool unavailable;
  } rows[] = {
      {{.output = {'P', 0}}, {}, false},
      {{.a = -1}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -1}, true},
      {{.a = -1000}, {TEEC_SUCCESS, TEEC_ORIGIN_TRUSTED_APP, -1000}, false},
      {{.output = {'P'}}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
      {{.output = {}}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
      {{.output_size = 1 << 20}, {TEEC_ERROR_BAD_FORMAT, TEEC_ORIGIN_API}, false},
  };
  for (const auto& row : rows) {
    answer_with(row.reply);
    const soter_result exported = commands.export_attk();
    EXPECT_EQ(exported.text(), row.expected.text());
    EXPECT_EQ(exported.unavailable, row.unavailable);
    EXPECT_EQ(exported.data, row.expected.ok() ? bytes{'P'} : bytes{});
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
