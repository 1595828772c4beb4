// The DER codec of ECDSA signatures: what it makes, and that it takes nothing else.
#include "ta/alg/ec/ec_signature.h"

#include <vector>

#include "fixture.h"

namespace keymaster {
namespace {

using bytes = std::vector<uint8_t>;

bytes of(byte_view view) {
  return {view.begin(), view.end()};
}

bytes joined(std::initializer_list<bytes> parts) {
  bytes result;
  for (const bytes& part : parts)
    result.insert(result.end(), part.begin(), part.end());
  return result;
}

using EcSignature = platform::fixture;

TEST_F(EcSignature, Lengths) {
  const std::pair<uint32_t, bytes> rows[] = {{126, {126}},
                                             {127, {0x81, 0x7F}},
                                             {254, {0x81, 0xFE}},
                                             {255, {0x82, 0x00, 0xFF}},
                                             {65534, {0x82, 0xFF, 0xFE}},
                                             {65535, {0x83, 0x00, 0xFF, 0xFF}},
                                             {16777214, {0x83, 0xFF, 0xFF, 0xFE}},
                                             {16777215, {0x84, 0x00, 0xFF, 0xFF, 0xFF}}};
  for (const auto& [length, encoding] : rows) {
    uint8_t room[5];
    output_cursor out(room);
    EXPECT_TRUE(encode_length(&out, length)) << length;
    EXPECT_EQ(of(byte_view(room).first(out.written())), encoding);
    output_cursor narrow(byte_span(room).first(encoding.size() - 1));
    EXPECT_FALSE(encode_length(&narrow, length)) << length;
  }
}

const bytes HIGH = joined({{0x80}, bytes(31, 7)});     // reads as negative without a 0 in front
const bytes LONG = joined({{0x01}, bytes(65, 0xAB)});  // of a curve of 521 bits
const bytes WIDE = bytes(57, 0x11);

TEST_F(EcSignature, EncodingsAndBack) {
  const struct {
    bytes r, s, encoding;
  } rows[] = {
      {HIGH, {5}, joined({{0x30, 0x26, 2, 0x21, 0}, HIGH, {2, 1, 5}})},
      {joined({{0, 0}, HIGH}), {0, 0x7F}, joined({{0x30, 0x26, 2, 0x21, 0}, HIGH, {2, 1, 0x7F}})},
      {LONG, LONG, joined({{0x30, 0x81, 0x88, 2, 0x42}, LONG, {2, 0x42}, LONG})},
      {{0, 0}, {1}, {0x30, 5, 2, 0, 2, 1, 1}},
      {WIDE, bytes(65, 0x11), joined({{0x30, 0x7E, 2, 57}, WIDE, {2, 65}, bytes(65, 0x11)})},
  };
  for (const auto& row : rows) {
    heap_buffer encoded;
    ASSERT_EQ(der_encode_ec_signature(row.r, row.s, &encoded), TEE_SUCCESS);
    EXPECT_EQ(of(encoded.view()), row.encoding);
    bytes r(70, 0xEE);
    bytes s(66, 0xEE);
    ASSERT_EQ(der_decode_ec_signature(encoded.view(), r, s), TEE_SUCCESS);
    EXPECT_EQ(r, joined({bytes(70 - row.r.size()), row.r}));
    EXPECT_EQ(s, joined({bytes(66 - row.s.size()), row.s}));
  }
  // 127 bytes of content, of the whole or of a part, is the one size that cannot be written.
  for (const auto& [r, s] : {std::pair(WIDE, bytes(66, 0x11)), {bytes(127, 1), {1}}}) {
    heap_buffer encoded;
    EXPECT_EQ(der_encode_ec_signature(r, s, &encoded), TEE_ERROR_GENERIC);
    EXPECT_TRUE(platform::traced("Unfilled buffer, size calculation error"));
    EXPECT_FALSE(encoded);
  }
}

TEST_F(EcSignature, OnlyTheShortestFormIsTaken) {
  const bytes part(32, 0x11);
  const bytes integer = joined({{2, 32}, part});
  const std::pair<bytes, const char*> rows[] = {
      {{0x30}, "Wrong der length"},
      {joined({{0x31, 68}, integer, integer}), "Wrong tag, expect 0x30, got 0x31"},
      {joined({{0x30, 0x85, 0, 0, 0, 0, 68}, integer, integer}), "Decode length failed"},
      {joined({{0x30, 68}, integer, integer, {0}}),
       "Wrong length of sequence, expect 70B, got 71B"},
      {joined({{0x30, 0x84, 0xFF, 0xFF, 0xFF, 0xFF}, integer}),
       "Wrong length of sequence, expect 5B, got 40B"},
      {joined({{0x30, 68, 3, 32}, part, integer}), "Wrong tag, expect 0x02, got 0x03"},
      {joined({{0x30, 68}, integer, {2, 33}, part}),
       "Wrong length of integer, 32B available, got 33B"},
      {joined({{0x30, 38, 2, 0x84, 0xFF, 0xFF, 0xFF, 0xFF}, part}),
       "Wrong length of integer, 32B available, got -1B"},
      {joined({{0x30, 69, 2, 33, 1}, part, integer}), "Wrong length of R, expect max 32B, got 33B"},
      {joined({{0x30, 69}, integer, {2, 33, 1}, part}),
       "Wrong length of S, expect max 32B, got 33B"},
      {joined({{0x30, 0x81, 68}, integer, integer}), "Encoding size mismatch"},
      {joined({{0x30, 69, 2, 33, 0}, part, integer}), "Encoding size mismatch"},
      {joined({{0x30, 70}, integer, integer, {5, 0}}), "Encoding size mismatch"},
      {joined({{0x30, 35, 2, 0x80}, {2, 29}, bytes(29, 1), {5, 0}}), "Encoding size mismatch"},
      {joined({{0x30, 39, 2, 32, 0x91}, bytes(31, 1), {2, 3, 0, 1, 1}}), "Encoding mismatch"},
  };
  for (const auto& [der, message] : rows) {
    bytes r(32);
    bytes s(32);
    EXPECT_EQ(der_decode_ec_signature(der, r, s), TEE_ERROR_GENERIC) << message;
    EXPECT_TRUE(platform::traced(message)) << message << " but " << platform::trace_lines.back();
  }
}

}  // namespace
}  // namespace keymaster
