// Attestation through the command interface, read back and verified with libcrypto.
#include <cstring>
#include <gtest/gtest.h>
#include <memory>
#include <openssl/evp.h>
#include <openssl/x509.h>
#include <openssl/x509v3.h>
#include <string>

#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

constexpr size_t STORED_SIZE = 783;

struct deleter {
  void operator()(X509* certificate) const { X509_free(certificate); }
  void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
};
using certificate = std::unique_ptr<X509, deleter>;

certificate parse(byte_view der) {
  const unsigned char* next = der.data();
  certificate parsed(d2i_X509(nullptr, &next, static_cast<long>(der.size())));
  EXPECT_TRUE(parsed);
  EXPECT_EQ(next, der.data() + der.size());
  return parsed;
}

uint32_t load_u32(byte_view bytes) {
  uint32_t value = 0;
  memcpy(&value, bytes.data(), sizeof(value));
  return value;
}

// The two certificates of a chain; its lengths must cover it exactly.
std::vector<certificate> parse_chain(byte_view chain) {
  std::vector<certificate> links;
  while (chain.size() >= 4) {
    const uint32_t length = load_u32(chain);
    EXPECT_LE(length, chain.size() - 4);
    links.push_back(parse(chain.subspan(4, length)));
    chain = chain.subspan(4 + length);
  }
  EXPECT_TRUE(chain.empty());
  return links;
}

request attest_request(byte_view blob, const param_set& params = {}, size_t capacity = AMPLE) {
  client::field_writer input;
  input.field(blob).field(params.marshal());
  return {static_cast<uint32_t>(command::ATTEST_KEY), 0, input.take(), capacity};
}

param_set ec_description() {
  param_set set;
  set.add(KM_TAG_ALGORITHM, KM_ALGORITHM_EC)
      .add(KM_TAG_KEY_SIZE, 256)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
  return set;
}

param_set rsa_description() {
  param_set set;
  set.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
      .add(KM_TAG_KEY_SIZE, 1024)
      .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_ACTIVE_DATETIME, 1'000'000'000'999)
      .add(KM_TAG_USAGE_EXPIRE_DATETIME, 1'900'000'000'000)
      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
  return set;
}

std::string time_text(const ASN1_TIME* time) {
  return std::string(reinterpret_cast<const char*>(ASN1_STRING_get0_data(time)),
                     static_cast<size_t>(ASN1_STRING_length(time)));
}

// The content octets of extension `id` of a certificate, in hex.
bytes extension_value(const certificate& from, const char* id) {
  const std::unique_ptr<ASN1_OBJECT, decltype(&ASN1_OBJECT_free)> object(OBJ_txt2obj(id, 1),
                                                                         ASN1_OBJECT_free);
  const int index = X509_get_ext_by_OBJ(from.get(), object.get(), -1);
  if (index < 0) return {};
  const ASN1_OCTET_STRING* value = X509_EXTENSION_get_data(X509_get_ext(from.get(), index));
  const unsigned char* data = ASN1_STRING_get0_data(value);
  return bytes(data, data + ASN1_STRING_length(value));
}

TEST(Attestation, ChainsVerifyForRsaAndEc) {
  ta_under_test ta;
  const struct {
    param_set description;
    const char* not_before;
    const char* not_after;
    bytes key_usage;
  } cases[] = {
      {ec_description(), "700101000000Z", "060207062815Z", {3, 2, 0, 0x80}},
      // The expiry is cut to 32 bits of milliseconds before it becomes seconds.
      {rsa_description(), "010909014640Z", "700219170247Z", {3, 2, 0, 0xB0}},
  };
  for (const auto& row : cases) {
    const bytes blob = ta.generate(row.description);
    param_set params;
    params.add_bytes(KM_TAG_ATTESTATION_CHALLENGE, bytes{1, 2, 3});
    const reply answer = ta.send(attest_request(blob, params));
    ASSERT_TRUE(succeeded(answer));
    EXPECT_EQ(answer.b, 2u);
    const std::vector<certificate> chain = parse_chain(answer.output());
    ASSERT_EQ(chain.size(), 2u);
    EXPECT_EQ(X509_verify(chain[0].get(), X509_get0_pubkey(chain[1].get())), 1);
    EXPECT_EQ(X509_verify(chain[1].get(), X509_get0_pubkey(chain[1].get())), 1);
    EXPECT_EQ(X509_check_issued(chain[1].get(), chain[0].get()), X509_V_OK);
    EXPECT_EQ(X509_get_version(chain[0].get()), 2);
    EXPECT_EQ(ASN1_INTEGER_get(X509_get0_serialNumber(chain[0].get())), 1);
    EXPECT_EQ(time_text(X509_get0_notBefore(chain[0].get())), row.not_before);
    EXPECT_EQ(time_text(X509_get0_notAfter(chain[0].get())), row.not_after);
    EXPECT_EQ(extension_value(chain[0], "2.5.29.15"), row.key_usage);
    EXPECT_FALSE(extension_value(chain[0], "1.3.6.1.4.1.11129.2.1.17").empty());
    // The common name keeps its terminating zero.
    const X509_NAME* subject = X509_get_subject_name(chain[0].get());
    const ASN1_STRING* name = X509_NAME_ENTRY_get_data(X509_NAME_get_entry(subject, 0));
    EXPECT_EQ(ASN1_STRING_length(name), 16);
  }
}

TEST(Attestation, SubjectKeyIsTheExportedKey) {
  ta_under_test ta;
  const bytes blob = ta.generate(rsa_description());
  const std::vector<certificate> chain = parse_chain(ta.send(attest_request(blob)).output());
  const reply exported = ta.send(key_request(command::EXPORT_KEY, blob));
  ASSERT_TRUE(succeeded(exported));
  const unsigned char* next = exported.output().data();
  const std::unique_ptr<EVP_PKEY, deleter> key(
      d2i_PUBKEY(nullptr, &next, static_cast<long>(exported.output_size)));
  EXPECT_EQ(EVP_PKEY_eq(key.get(), X509_get0_pubkey(chain.at(0).get())), 1);
}

// Capacities: a length that does not fit, a new certificate that does not fit, a stored one
// that does not fit, and room for all.
TEST(Attestation, Capacities) {
  ta_under_test ta;
  const bytes blob = ta.generate(ec_description());
  const reply whole = ta.send(attest_request(blob));
  ASSERT_TRUE(succeeded(whole));
  const size_t first = 4 + load_u32(whole.output());
  ASSERT_EQ(whole.output_size, first + 4 + STORED_SIZE);
  // Each one costs a signature: all near the boundaries, one in 61 between them.
  const auto near = [](size_t a, size_t b) { return a + 6 > b && b + 6 > a; };
  for (size_t capacity = 0; capacity <= whole.output_size + 1; capacity++) {
    if (!near(capacity, 4) && !near(capacity, first) && !near(capacity, whole.output_size) &&
        capacity % 61 != 0) {
      continue;
    }
    const reply answer = ta.send(attest_request(blob, {}, capacity));
    if (capacity < 4) {
      ASSERT_TRUE(failed_with(answer, TEEC_ERROR_GENERIC)) << capacity;
    } else if (capacity < first) {
      ASSERT_TRUE(refused(answer, KM_ERROR_MEMORY_ALLOCATION_FAILED)) << capacity;
    } else if (capacity < whole.output_size) {
      ASSERT_TRUE(failed_with(answer, TEEC_ERROR_GENERIC)) << capacity;
      ASSERT_EQ(answer.b, 1u);
    } else {
      ASSERT_TRUE(succeeded(answer)) << capacity;
    }
    ASSERT_EQ(answer.output_size, answer.ok() ? whole.output_size : 0u);
  }
}

TEST(Attestation, Refusals) {
  ta_under_test ta;
  param_set hmac;
  hmac.add(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
      .add(KM_TAG_KEY_SIZE, 256)
      .add(KM_TAG_MIN_MAC_LENGTH, 128)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  EXPECT_TRUE(refused(ta.send(attest_request(ta.generate(hmac))), KM_ERROR_UNSUPPORTED_ALGORITHM));
  const bytes blob = ta.generate(ec_description());
  param_set params;
  params.add_bytes(KM_TAG_ATTESTATION_CHALLENGE, bytes(129));
  EXPECT_TRUE(refused(ta.send(attest_request(blob, params)), KM_ERROR_INVALID_INPUT_LENGTH));
  EXPECT_TRUE(refused(ta.send(attest_request(bytes{1})), KM_ERROR_KEY_REQUIRES_UPGRADE));
  param_set unique = ec_description();
  unique.add_flag(KM_TAG_INCLUDE_UNIQUE_ID);
  EXPECT_TRUE(refused(ta.send(attest_request(ta.generate(unique))), KM_ERROR_UNIMPLEMENTED));
}

}  // namespace
}  // namespace keymaster::test
