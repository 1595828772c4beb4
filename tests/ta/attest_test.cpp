// Attestation through the command interface, read back and verified with libcrypto.
#include <algorithm>
#include <openssl/x509.h>
#include <openssl/x509v3.h>

#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using namespace std::string_literals;

constexpr size_t STORED_SIZE = 783;
const int KEY_DESCRIPTION = OBJ_create("1.3.6.1.4.1.11129.2.1.17", "keyDescription", "Attestation");

using certificate = std::unique_ptr<X509, decltype(&X509_free)>;

// Whether the bytes are values in DER (X.690, 10): each in the one form that it may have. The order
// of sets is not looked at: theirs is that of adding, which is intended.
bool is_der(byte_view in) {
  while (!in.empty()) {
    const uint8_t* at = in.data();
    long length = 0;
    int tag = 0;
    int tag_class = 0;
    const int form = ASN1_get_object(&at, &length, &tag, &tag_class, static_cast<long>(in.size()));
    if ((form & 0x80) != 0 || (form & 1) != 0) return false;  // malformed, or without a length
    const byte_view content(at, static_cast<size_t>(length));
    const bool constructed = (form & V_ASN1_CONSTRUCTED) != 0;
    const int shortest = ASN1_object_size(constructed ? 1 : 0, static_cast<int>(length), tag);
    if (content.data() + length - in.data() != shortest) return false;
    if (constructed && !is_der(content)) return false;
    const bool padded = length > 1 && (content[0] == 0 || content[0] == 0xFF) &&
                        (content[0] & 0x80) == (content[1] & 0x80);
    const bool integer = tag_class == V_ASN1_UNIVERSAL && tag == V_ASN1_INTEGER;
    const bool boolean = tag_class == V_ASN1_UNIVERSAL && tag == V_ASN1_BOOLEAN;
    if (integer && (length == 0 || padded)) return false;
    if (boolean && (length != 1 || content[0] != 0xFF)) return false;  // FALSE is the default
    in = in.subspan(static_cast<size_t>(shortest));
  }
  return true;
}

// The two certificates of a chain; its lengths must cover it exactly.
std::vector<certificate> parse_chain(byte_view chain) {
  std::vector<certificate> links;
  client::field_reader reader(chain);
  while (reader.left() > 0) {
    const byte_view der = reader.field();
    EXPECT_TRUE(is_der(der));
    const unsigned char* next = der.data();
    links.emplace_back(d2i_X509(nullptr, &next, static_cast<long>(der.size())), X509_free);
    EXPECT_EQ(next, der.data() + der.size());
  }
  return links;
}

const param_set EC_256_KEY = one(KM_TAG_ALGORITHM, KM_ALGORITHM_EC)
                                 .add(KM_TAG_KEY_SIZE, 256)
                                 .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                                 .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
                                 .add_flag(KM_TAG_NO_AUTH_REQUIRED);

const param_set RSA_KEY =
    one(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
        .add(KM_TAG_KEY_SIZE, 1024)
        .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
        .append(several(KM_TAG_PURPOSE, {KM_PURPOSE_SIGN, KM_PURPOSE_ENCRYPT}))
        .add(KM_TAG_ACTIVE_DATETIME, 1'000'000'000'999)
        .add(KM_TAG_USAGE_EXPIRE_DATETIME, 1'900'000'000'000)
        .add_flag(KM_TAG_NO_AUTH_REQUIRED);

std::string text_of(const ASN1_STRING* string) {
  return std::string(reinterpret_cast<const char*>(ASN1_STRING_get0_data(string)),
                     static_cast<size_t>(ASN1_STRING_length(string)));
}

// With its terminating zero, which is part of it.
std::string common_name(const X509_NAME* name) {
  return text_of(X509_NAME_ENTRY_get_data(X509_NAME_get_entry(name, 0)));
}

// The content octets of an extension, by its NID.
bytes extension_value(const certificate& from, int id) {
  const int index = X509_get_ext_by_NID(from.get(), id, -1);
  if (index < 0) return {};
  const auto* value = X509_EXTENSION_get_data(X509_get_ext(from.get(), index));
  return client::copy_of(client::as_bytes(text_of(value)));
}

// What it certifies, as a SubjectPublicKeyInfo.
bytes subject_of(const certificate& from) {
  bytes spki(1024);
  uint8_t* end = spki.data();
  spki.resize(static_cast<size_t>(i2d_PUBKEY(X509_get0_pubkey(from.get()), &end)));
  return spki;
}

TEST(Attestation, ChainsVerifyForRsaAndEc) {
  EXPECT_TRUE(is_der(bytes{2, 2, 0, 0x80, 1, 1, 0xFF}));
  EXPECT_FALSE(is_der(bytes{2, 0x81, 1, 5}) || is_der(bytes{2, 2, 0, 5}) || is_der(bytes{1, 1, 1}));
  ta_under_test ta;
  const param_set verifying = with(EC_256_KEY, KM_TAG_PURPOSE, {VERIFY});
  const param_set decrypting = with(RSA_KEY, KM_TAG_PURPOSE, {DECRYPT});
  // The key, what is asked for, the certificate's validity and its key usage.
  const std::tuple<param_set, param_set, const char*, const char*, uint8_t> cases[] = {
      {verifying, {}, "700101000000Z", "060207062815Z", 0x80},
      // The algorithm that is asked for chooses no other key.
      {decrypting, one(KM_TAG_ALGORITHM, KM_ALGORITHM_EC), "010909014640Z", "700219170247Z", 0x30},
      // The expiry is cut to 32 bits of milliseconds before it becomes seconds.
      {RSA_KEY, {}, "010909014640Z", "700219170247Z", 0xB0},
  };
  for (const auto& [key, asked, not_before, not_after, key_usage] : cases) {
    const bytes blob = ta.generate(key);
    const reply answer = ta.send_well(
        attest_request(blob, param_set(asked).add_bytes(KM_TAG_ATTESTATION_CHALLENGE, bytes(3))));
    EXPECT_EQ(answer.b, 2u);
    const std::vector<certificate> chain = parse_chain(answer.output());
    ASSERT_EQ(chain.size(), 2u);
    EXPECT_EQ(X509_verify(chain[0].get(), X509_get0_pubkey(chain[1].get())), 1);
    EXPECT_EQ(X509_verify(chain[1].get(), X509_get0_pubkey(chain[1].get())), 1);
    EXPECT_EQ(X509_check_issued(chain[1].get(), chain[0].get()), X509_V_OK);
    EXPECT_EQ(X509_get_version(chain[0].get()), 2);
    EXPECT_EQ(ASN1_INTEGER_get(X509_get0_serialNumber(chain[0].get())), 1);
    EXPECT_EQ(text_of(X509_get0_notBefore(chain[0].get())), not_before);
    EXPECT_EQ(text_of(X509_get0_notAfter(chain[0].get())), not_after);
    EXPECT_EQ(extension_value(chain[0], NID_key_usage), (bytes{3, 2, 0, key_usage}));
    const bytes description = extension_value(chain[0], KEY_DESCRIPTION);
    EXPECT_TRUE(!description.empty() && is_der(description));
    EXPECT_EQ(common_name(X509_get_subject_name(chain[0].get())), "A Keymaster Key\0"s);
    EXPECT_EQ(common_name(X509_get_issuer_name(chain[0].get())).size(), 18u);
    EXPECT_EQ(X509_get_signature_nid(chain[0].get()), NID_sha256WithRSAEncryption);
    if (key.number(KM_TAG_ALGORITHM) == KM_ALGORITHM_EC) continue;
    EXPECT_EQ(subject_of(chain[0]),
              client::copy_of(ta.send_well(key_request(command::EXPORT_KEY, blob)).output()));
  }
}

// A length, a new certificate or the stored one that does not fit, and room for all; the sizes
// between are the sweep's.
TEST(Attestation, Capacities) {
  ta_under_test ta;
  const bytes blob = ta.generate(EC_256_KEY);
  const reply whole = ta.send_well(attest_request(blob));
  const size_t first = 4 + client::field_reader(whole.output()).u32();
  ASSERT_EQ(whole.output_size, first + 4 + STORED_SIZE);
  // The room, both results, and how many certificates are there.
  const std::tuple<size_t, TEEC_Result, int32_t, uint32_t> rows[] = {
      {0, TEEC_ERROR_GENERIC, 0, 0},
      {3, TEEC_ERROR_GENERIC, 0, 0},
      {4, TEEC_SUCCESS, KM_ERROR_MEMORY_ALLOCATION_FAILED, 0},
      {first - 1, TEEC_SUCCESS, KM_ERROR_MEMORY_ALLOCATION_FAILED, 0},
      {first, TEEC_ERROR_GENERIC, 0, 1},
      {whole.output_size - 1, TEEC_ERROR_GENERIC, 0, 1},
      {whole.output_size, TEEC_SUCCESS, 0, 2}};
  for (const auto& [capacity, res, error, b] : rows) {
    const reply answer = ta.send(attest_request(blob, {}, capacity));
    EXPECT_TRUE(failed_with(answer, res)) << capacity;
    EXPECT_EQ(answer.km_error, error) << capacity;
    EXPECT_EQ(answer.b, b) << capacity;
    EXPECT_EQ(answer.output_size, answer.ok() ? whole.output_size : 0u);
  }
  // Where not even a length fits, nothing is signed.
  const auto calls = [&](size_t capacity) {
    const uint64_t before = tee::host::fallible_calls();
    ta.send(attest_request(blob, {}, capacity));
    return tee::host::fallible_calls() - before;
  };
  EXPECT_LT(calls(3), calls(4));
}

TEST(Attestation, Refusals) {
  ta_under_test ta;
  EXPECT_TRUE(
      refused(ta.send(attest_request(ta.generate(hmac_key(256)))), KM_ERROR_UNSUPPORTED_ALGORITHM));
  const bytes blob = ta.generate(EC_256_KEY);
  for (const size_t size : {128u, 129u}) {
    const auto challenge = param_set().add_bytes(KM_TAG_ATTESTATION_CHALLENGE, bytes(size));
    EXPECT_TRUE(refused(ta.send(attest_request(blob, challenge)),
                        size == 128 ? KM_ERROR_OK : KM_ERROR_INVALID_INPUT_LENGTH));
  }
  EXPECT_TRUE(refused(ta.send(attest_request(bytes{1})), KM_ERROR_KEY_REQUIRES_UPGRADE));
  const bytes unique = ta.generate(param_set(EC_256_KEY).add_flag(KM_TAG_INCLUDE_UNIQUE_ID));
  EXPECT_TRUE(refused(ta.send(attest_request(unique)), KM_ERROR_UNIMPLEMENTED));
  // What is asked for counts before the room for it.
  const auto too_long = param_set().add_bytes(KM_TAG_ATTESTATION_CHALLENGE, bytes(129));
  EXPECT_TRUE(refused(ta.send(attest_request(blob, too_long, 0)), KM_ERROR_INVALID_INPUT_LENGTH));
  EXPECT_TRUE(refused(ta.send(attest_request(unique, {}, 3)), KM_ERROR_UNIMPLEMENTED));
  // A unique id is made of the creation date, which an imported RSA key has not.
  const bytes undated =
      ta.import(without(RSA_KEY, KM_TAG_KEY_SIZE).add_flag(KM_TAG_INCLUDE_UNIQUE_ID),
                pkey::rsa(1024).import_data());
  EXPECT_TRUE(refused(ta.send(attest_request(undated)), KM_ERROR_INVALID_KEY_BLOB));
  request no_set = attest_request(blob);
  no_set.input[4 + blob.size() + 4] = 3;  // announces parameters that are not there
  EXPECT_TRUE(failed_with(ta.send(no_set), TEEC_ERROR_BAD_PARAMETERS));
}

// Numbers are imported as long as they are; points have numbers of full length.
TEST(Attestation, OfShortCoordinates) {
  ta_under_test ta;
  pkey key = pkey::ec(521);
  while (key.number(OSSL_PKEY_PARAM_EC_PUB_X).size() == 66)
    key = pkey::ec(521);
  const bytes x = key.number(OSSL_PKEY_PARAM_EC_PUB_X);
  const bytes blob = ta.import(without(EC_256_KEY, KM_TAG_KEY_SIZE), key.import_data({{0, x}}));
  const auto chain = parse_chain(ta.send_well(attest_request(blob)).output());
  EXPECT_EQ(pkey::rsa_public(subject_of(chain.at(0))).number(OSSL_PKEY_PARAM_EC_PUB_X), x);
}

// Descriptions beyond the first buffer and beyond its double, and a certificate beyond 64 KiB: the
// output is the bound. The application is attested without being asked for.
TEST(Attestation, OfLongDescriptions) {
  ta_under_test ta;
  for (const size_t size : {1100u, 2500u, 70'000u}) {
    const bytes application(size, 'x');
    const request made = generate_request(
        param_set(EC_256_KEY).add_bytes(KM_TAG_APPLICATION_ID, application), size + AMPLE);
    const reply key = ta.send_well(made);
    const reply whole = ta.send_well(attest_request(key.output(), {}, size + AMPLE));
    const size_t first = whole.output_size - 4 - STORED_SIZE;
    EXPECT_TRUE(refused(ta.send(attest_request(key.output(), {}, first - 1)),
                        KM_ERROR_MEMORY_ALLOCATION_FAILED));
    const auto chain = parse_chain(whole.output());
    const bytes description = extension_value(chain.at(0), KEY_DESCRIPTION);
    EXPECT_NE(std::ranges::search(description, application).begin(), description.end());
    EXPECT_EQ(X509_verify(chain[0].get(), X509_get0_pubkey(chain.at(1).get())), 1);
  }
}

}  // namespace
}  // namespace keymaster::test
