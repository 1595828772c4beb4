// The DER writer and the key description, against encodings that were written by hand.
#include <algorithm>
#include <string>
#include <vector>

#include "fixture.h"
#include "ta/attest/key_description.h"
#include "ta/der/oids.h"
#include "ta/der/x509.h"

namespace keymaster {
namespace {

std::string hex(byte_view bytes) {
  static constexpr char DIGITS[] = "0123456789abcdef";
  std::string text;
  for (const uint8_t byte : bytes) {
    text += DIGITS[byte >> 4];
    text += DIGITS[byte & 15];
  }
  return text;
}

using KeyDescriptions = platform::fixture;

// What a writer makes of a buffer of `size` bytes: hex, or the negative code as text.
template <class Write>
std::string written(Write write, size_t size = 64) {
  std::vector<uint8_t> buffer(size);
  der_cursor out(buffer);
  const int32_t length = write(&out);
  if (length < 0) return std::to_string(length);
  EXPECT_EQ(static_cast<size_t>(length), out.written().size());
  return hex(out.written());
}

TEST(DerWriter, Primitives) {
  const auto integer = [](uint64_t value) {
    return written([=](der_cursor* out) { return der_write_integer(out, value); });
  };
  EXPECT_EQ(integer(0), "020100");
  EXPECT_EQ(integer(128), "02020080");
  EXPECT_EQ(integer(32767), "02027fff");
  EXPECT_EQ(integer(UINT64_MAX), "020900ffffffffffffffff");

  uint64_t fresh = 0;
  ASN1_INTEGER_TYPE.initialise(&fresh);
  EXPECT_EQ(integer(fresh), "020500deadbeaf") << "what was never set shows";

  const auto tag = [](uint32_t word) {
    return written([=](der_cursor* out) { return der_write_tag(out, word); });
  };
  EXPECT_EQ(tag(DER_CONTEXT | DER_CONSTRUCTED | 30), "be");
  EXPECT_EQ(tag(DER_CONTEXT | DER_CONSTRUCTED | 31), "bf1f");
  EXPECT_EQ(tag(DER_CONTEXT | DER_CONSTRUCTED | 704), "bf8540");
  EXPECT_EQ(tag(0x40000001), "-104");

  const auto length = [](size_t value) {
    return written([=](der_cursor* out) { return der_write_length(out, value); });
  };
  EXPECT_EQ(length(127), "7f");
  EXPECT_EQ(length(128), "8180");
  EXPECT_EQ(length(256), "820100");
  EXPECT_EQ(length(0x1000000), "8401000000");

  const auto oid = [](const ASN1_OID& id) {
    return written([&](der_cursor* out) { return _ASN1_OID_write(out, &id); });
  };
  EXPECT_EQ(oid(OID_KEY_DESCRIPTION), "060a2b06010401d679020111");
  EXPECT_EQ(written([](der_cursor* out) { return _ASN1_OID_write(out, nullptr); }), "-104");
}

TEST(DerWriter, BitStringsGrowWhenBitsAreCleared) {
  ASN1_BIT_STRING bits{};
  for (uint32_t i = 0; i < 8; i++)
    ASSERT_EQ(ASN1_BIT_STRING_set_bit(&bits, i, false), 0);
  ASSERT_EQ(ASN1_BIT_STRING_set_bit(&bits, 0, true), 0);
  const auto text = [&] {
    return written([&](der_cursor* out) { return ASN1_BIT_STRING_TYPE.write(out, &bits); });
  };
  EXPECT_EQ(text(), "03020080");
  ASSERT_EQ(ASN1_BIT_STRING_set_bit(&bits, 9, true), 0);
  EXPECT_EQ(text(), "0303068040");
  ASN1_BIT_STRING_TYPE.free(&bits);
}

// The name that a failed allocation goes out under.
template <class Make>
std::string name_without_memory(Make make) {
  platform::trace_lines.clear();
  platform::allocations_to_fail = 1;
  EXPECT_EQ(make(), nullptr);
  if (platform::trace_lines.size() != 1) return "";
  const std::string& line = platform::trace_lines[0];
  EXPECT_NE(line.find(": Out of memory, need "), std::string::npos);
  const size_t name = line.find("KEYMASTER:") + 10;
  return line.substr(name, line.find(':', name) - name);
}

TEST_F(KeyDescriptions, AllocationsTraceUnderTheirOwnNames) {
  const trace_scope caller("caller");
  SET_OF_INTEGER set{};
  X509_NAME name{};
  X509_EXTENSIONS extensions{};
  EXPECT_EQ(name_without_memory(X509_CINF_alloc), "X509_CINF_alloc");
  EXPECT_EQ(name_without_memory(RSA_PUBKEY_alloc), "RSA_PUBKEY_alloc");
  EXPECT_EQ(name_without_memory(KeyDescription_alloc), "KeyDescription_alloc");
  EXPECT_EQ(name_without_memory([&] { return SET_OF_INTEGER_alloc_item(&set); }),
            "SET_OF_INTEGER_alloc_item");
  EXPECT_EQ(name_without_memory([&] { return X509_NAME_alloc_item(&name); }),
            "X509_NAME_alloc_item");
  EXPECT_EQ(name_without_memory([&] { return X509_EXTENSIONS_alloc_item(&extensions); }),
            "X509_EXTENSIONS_alloc_item");
}

// Expected texts from `date -u -d @SECONDS`; the last year is beyond any calendar, and still text.
TEST(DerWriter, Dates) {
  const std::pair<uint64_t, std::string> cases[] = {
      {4294967, "19700219170247Z"},
      {951782400, "20000229000000Z"},
      {4107542400, "21000301000000Z"},
      {0xFFFFFFFF, "21060207062815Z"},
  };
  for (const auto& [seconds, text] : cases) {
    for (const uint32_t type : {DER_UTC_TIME, DER_GENERALIZED_TIME}) {
      const ASN1_TIME time = ASN1_TIME_from_seconds(type, seconds);
      uint8_t buffer[32];
      const int32_t length = X509_TIME_write(&time, buffer, sizeof(buffer));
      const bool utc = type == DER_UTC_TIME;
      ASSERT_EQ(length, utc ? 15 : 17);
      EXPECT_EQ(buffer[0], type);
      EXPECT_EQ(std::string(buffer + 2, buffer + length), text.substr(utc ? 2 : 0));
    }
  }
  uint8_t buffer[32];
  const ASN1_TIME last = ASN1_TIME_from_seconds(DER_UTC_TIME, UINT64_MAX);
  EXPECT_EQ(X509_TIME_write(&last, buffer, sizeof(buffer)), 15);
}

// An IMPLICIT tag, and one without a mode.
constexpr asn1_field TAGGED_FIELDS[] = {{0, ASN1_IMPLICIT | 0x81, &ASN1_INTEGER_TYPE, ASN1_ALWAYS},
                                        {0, 0xC0000000, &ASN1_INTEGER_TYPE, ASN1_ALWAYS}};

TEST(DerRecords, TagModes) {
  const uint64_t value = 5;
  const std::span<const asn1_field> fields(TAGGED_FIELDS);
  EXPECT_EQ(
      written([&](der_cursor* out) { return asn1_sequence_write(fields.first(1), out, &value); }),
      "3003810105");
  EXPECT_EQ(written([&](der_cursor* out) { return asn1_sequence_write(fields, out, &value); }),
            "-104");
}

keymaster_key_param_set_t sample_characteristics() {
  keymaster_key_param_set_t set;
  const uint8_t application[] = {'a', 'p', 'p'};
  EXPECT_TRUE(add_integer(&set, KM_TAG_PURPOSE, KM_PURPOSE_VERIFY));
  EXPECT_TRUE(add_integer(&set, KM_TAG_PURPOSE, KM_PURPOSE_SIGN));
  EXPECT_TRUE(add_integer(&set, KM_TAG_PURPOSE, KM_PURPOSE_SIGN));
  EXPECT_TRUE(add_integer(&set, KM_TAG_ALGORITHM, KM_ALGORITHM_EC));
  EXPECT_TRUE(add_integer(&set, KM_TAG_KEY_SIZE, 224));
  EXPECT_TRUE(add_integer(&set, KM_TAG_KEY_SIZE, 256));
  EXPECT_TRUE(add_long(&set, KM_TAG_ACTIVE_DATETIME, 0x8000000000000000));
  EXPECT_TRUE(add_long(&set, KM_TAG_NO_AUTH_REQUIRED, 1));
  EXPECT_TRUE(add_blob(&set, KM_TAG_APPLICATION_ID, application));
  EXPECT_TRUE(add_integer(&set, KM_TAG_BLOCK_MODE, KM_MODE_CBC));
  EXPECT_TRUE(add_integer(&set, 0x70002AFB, 1));
  return set;
}

// Elements of a set stay as they were added, a repeated scalar keeps its last value, a tag without
// a field is passed over, an unknown one is traced.
// clang-format off
constexpr char SAMPLE_EXTENSION[] =
    "30818b"                            // Extension, not critical
    "060a2b06010401d679020111" "047d"   // its identifier and content
    "307b"                              // KeyDescription
    "020101020101020102020101"          // versions and security levels 1, 1, 2, 1
    "0403c0ffee" "0400"                 // challenge, unique id
    "3000"                              // software enforced
    "3064"                              // TEE enforced
    "a10b3109020103020102020102"        // purpose
    "a203020103"                        // algorithm
    "a30402020100"                      // key size
    "bf83100b0209008000000000000000"    // active date-time
    "bf837702" "0500"                   // no auth required
    "bf84590504" "03617070"             // application id
    "bf85402a3028"                      // root of trust
    "0420" "3538323033393437313635303239333834373536313032393338343735363130"
    "0101ff" "020100";
// clang-format on

TEST_F(KeyDescriptions, EncodeAsWrittenByHand) {
  keymaster_key_param_set_t request;
  const uint8_t challenge[] = {0xC0, 0xFF, 0xEE};
  ASSERT_TRUE(add_blob(&request, KM_TAG_ATTESTATION_CHALLENGE, challenge));
  X509_EXTENSION* extension = X509_EXTENSION_alloc();
  ASSERT_EQ(character_to_extension(sample_characteristics(), {}, request, extension), KM_ERROR_OK);
  const auto write = [=](der_cursor* out) { return X509_EXTENSION_TYPE.write(out, extension); };
  EXPECT_EQ(written(write, 256), SAMPLE_EXTENSION);
  X509_EXTENSION_free(extension);
  EXPECT_EQ(platform::trace_lines.size(), 1u);
  EXPECT_TRUE(platform::traced("Unknown tag 0x70002afb"));
}

TEST_F(KeyDescriptions, FitOrAreRefused) {
  KeyDescription* description = KeyDescription_alloc();
  ASSERT_EQ(fill_auth_list_by_param_set(sample_characteristics(), &description->tee_enforced),
            KM_ERROR_OK);
  uint8_t whole[256];
  const int32_t need = KeyDescription_write(description, whole, sizeof(whole));
  ASSERT_GT(need, 0);
  for (int32_t size = 0; size <= need + 1; size++) {
    std::vector<uint8_t> buffer(static_cast<size_t>(size));
    const int32_t length = KeyDescription_write(description, buffer.data(), buffer.size());
    ASSERT_EQ(length, size < need ? DER_TOO_SMALL : need);
    EXPECT_TRUE(length < 0 || std::equal(whole, whole + need, buffer.begin()));
  }
  KeyDescription_free(description);
}

}  // namespace
}  // namespace keymaster
