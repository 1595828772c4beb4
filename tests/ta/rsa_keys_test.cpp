// RSA keys through the command interface: new ones, those that come in any form, and numbers that
// are no key.
#include "ta/rsa.h"

namespace keymaster::test {
namespace {

using RsaKeys = rsa_device;

const pkey KEY_512 = pkey::rsa(512);

param_set new_key(uint64_t bits, uint64_t exponent) {
  return one(KM_TAG_KEY_SIZE, bits).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent).append(ANY_USE);
}

TEST_F(RsaKeys, NewKeysAreChecked) {
  const std::string no_exponent = "No or too many KM_TAG_RSA_PUBLIC_EXPONENT specified";
  const param_set good = new_key(512, 65537);
  const bad_key rows[] = {
      {param_set(good).add(KM_TAG_ORIGIN, 0), -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {without(good, KM_TAG_RSA_PUBLIC_EXPONENT), -38, no_exponent},
      {with(good, KM_TAG_RSA_PUBLIC_EXPONENT, {3, 3}), -38, no_exponent},
      {without(good, KM_TAG_KEY_SIZE), -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      {new_key(8200, 65537), -6, "Invalid RSA key size 8200"},
      {new_key(513, 65537), -6, "Invalid RSA key size 513"},
  };
  ta.expect_refused_keys("rsa_", rows);
  // What the platform cannot do is its own code and an unknown error together.
  for (const auto& [bits, exponent, code] : {std::tuple(504, 65537, TEEC_ERROR_NOT_SUPPORTED),
                                             {512, 4, TEEC_ERROR_BAD_PARAMETERS},
                                             {512, 1, TEEC_ERROR_BAD_PARAMETERS}}) {
    const reply answer = ta.send(generate_request(new_key(bits, exponent)));
    EXPECT_TRUE(failed_with(answer, code)) << bits << ", " << exponent;
    EXPECT_EQ(answer.km_error, -1000);
  }
}

TEST_F(RsaKeys, GeneratedKeysWorkAndAreExported) {
  for (const auto& [bits, exponent] : {std::pair(1024, 3), {2048, 65537}}) {
    const bytes blob = ta.generate(new_key(bits, exponent));
    const param_set found = ta.characteristics(blob);
    EXPECT_EQ(found.number(KM_TAG_ORIGIN), KM_ORIGIN_GENERATED);
    EXPECT_EQ(found.number(KM_TAG_OS_VERSION), OS_VERSION);
    EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
    const reply exported = ta.send_well(key_request(command::EXPORT_KEY, blob));
    const pkey key = pkey::rsa_public(exported.output());
    EXPECT_EQ(key.number(OSSL_PKEY_PARAM_RSA_E), (exponent == 3 ? bytes{3} : bytes{1, 0, 1}));
    EXPECT_EQ(key.size() * 8, static_cast<size_t>(bits));
    EXPECT_TRUE(key.verify(PKCS1, text(5), ta.run(SIGN, blob, use(PKCS1), text(5))));
    ta.expect_refused(key_request(command::EXPORT_KEY, blob, {}, exported.output_size - 1), -1000);
  }
}

constexpr size_t MODULUS = 0;
constexpr size_t EXPONENT = 1;

bytes altered(size_t index, const bytes& number) {
  return KEY_512.import_data({{index, number}});
}

TEST_F(RsaKeys, ImportsTellTheirSizeAndExponent) {
  const bytes good = KEY_512.import_data();
  const bytes modulus = KEY_512.number(OSSL_PKEY_PARAM_RSA_N);
  const bytes nine = altered(EXPONENT, {0, 0, 0, 0, 0, 0, 1, 0, 1});
  const auto with_exponent = [](uint64_t exponent) {
    return one(KM_TAG_RSA_PUBLIC_EXPONENT, exponent).append(ANY_USE);
  };
  for (const auto& [description, data, bits] :
       {std::tuple(with(ANY_USE, KM_TAG_KEY_SIZE, {512}), good, 512u),
        {ANY_USE, altered(MODULUS, right_aligned(modulus, 65)), 520},
        {ANY_USE, altered(MODULUS, {}), 0},
        {ANY_USE, altered(MODULUS, bytes(1024, 1)), 8192},
        {ANY_USE, nine, 512},
        {with_exponent(65537), altered(EXPONENT, {0, 1, 0, 1}), 512}}) {
    const param_set found = ta.characteristics(ta.import(description, data));
    EXPECT_EQ(found.numbers(KM_TAG_KEY_SIZE), std::vector<uint64_t>{bits});
    EXPECT_EQ(found.numbers(KM_TAG_RSA_PUBLIC_EXPONENT), std::vector<uint64_t>{65537});
    EXPECT_EQ(found.number(KM_TAG_ORIGIN), KM_ORIGIN_IMPORTED);
    EXPECT_FALSE(found.contains(KM_TAG_CREATION_DATETIME));
  }
  ta.import(ANY_USE, altered(EXPONENT, bytes(8, 1)));
  ta.import(with_exponent(0x100000001), altered(EXPONENT, {1, 0, 0, 0, 1}));
  const bytes dated = ta.import(with(ANY_USE, KM_TAG_CREATION_DATETIME, {77}), good);
  EXPECT_EQ(ta.characteristics(dated).number(KM_TAG_CREATION_DATETIME), 77U);
  const bad_key rejected[] = {
      {with_exponent(3), -44, "Public exponent mismatch", good},
      {with_exponent(65537), -44, "Public exponent mismatch", nine},
      {ANY_USE, -44, "Public exponent mismatch", altered(EXPONENT, bytes(9, 1))},
      {with(ANY_USE, KM_TAG_KEY_SIZE, {511}), -44, "Key size mismatch (given 511, guessed 512)",
       good},
      {ANY_USE, -6, "Invalid RSA key size 8200", altered(MODULUS, bytes(1025, 1))},
      {with(ANY_USE, KM_TAG_OS_VERSION, {1}), -38, "Shouldn't specify KM_TAG_OS_VERSION", good},
  };
  ta.expect_refused_keys("rsa_", rejected);
}

// Numbers have no other meaning than their value: a key works as it does without zeros in front.
TEST_F(RsaKeys, ImportsOfUnusualFormAreUsed) {
  const scheme schemes[] = {RAW, PKCS1, PKCS1_SHA1, {KM_PAD_RSA_PSS, KM_DIGEST_SHA1}};
  const scheme encryptions[] = {RAW, PKCS1_ENCRYPT, {KM_PAD_RSA_OAEP, KM_DIGEST_SHA1}};
  std::map<size_t, bytes> zeros_everywhere;
  const char* const names[] = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                               OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                               OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                               OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  for (size_t i = 0; i < std::size(names); i++)
    zeros_everywhere[i] = right_aligned(KEY_512.number(names[i]), i == 2 ? 16000 : 70);
  const bytes modulus = KEY_512.number(OSSL_PKEY_PARAM_RSA_N);
  for (const auto& replaced : std::initializer_list<std::map<size_t, bytes>>{
           {{MODULUS, right_aligned(modulus, 65)}},
           zeros_everywhere,
           {{3, {}}, {4, {}}, {5, {}}, {6, {}}, {7, {}}}}) {
    const bytes blob = ta.import(ANY_USE, KEY_512.import_data(replaced), 4 * AMPLE);
    for (const scheme how : schemes) {
      const bytes message = how.padding == KM_PAD_NONE ? right_aligned(text(63), 64) : text(30);
      const bytes made = ta.run(SIGN, blob, use(how), message);
      EXPECT_TRUE(KEY_512.verify(how, message, made)) << how.padding;
      EXPECT_TRUE(succeeded(verify(blob, how, message, made))) << how.padding;
    }
    for (const scheme how : encryptions) {
      const bytes message = how.padding == KM_PAD_NONE ? right_aligned(text(9), 64) : text(9);
      const bytes made = ta.run(ENCRYPT, blob, use(how), message);
      EXPECT_EQ(KEY_512.decrypt(how, made), message) << how.padding;
      EXPECT_EQ(ta.run(DECRYPT, blob, use(how), made), message) << how.padding;
    }
    const pkey found =
        pkey::rsa_public(ta.send_well(key_request(command::EXPORT_KEY, blob)).output());
    EXPECT_EQ(found.number(OSSL_PKEY_PARAM_RSA_N), modulus);
  }
}

// Parity and lengths, and that primes come all or not at all, are found out here: a platform may
// end the TA that hands it such numbers. What they have to do with each other is the platform's.
TEST_F(RsaKeys, NumbersThatAreNoKeyAreRefusedWhenUsed) {
  bytes even = KEY_512.number(OSSL_PKEY_PARAM_RSA_N);
  even.back() ^= 1;
  const struct {
    size_t index;
    std::vector<bytes> malformed;
    std::vector<bytes> foreign;
  } rows[] = {
      {MODULUS, {{}, even, bytes(64), {0x0b}}, {bytes(64, 0xFF)}},
      {EXPONENT, {{}, bytes(8)}, {{1}, {3}, {4}}},
      {2, {{}, bytes(65, 0xEE), bytes(2000, 1), bytes(16000, 1)}, {{5}}},
      {3, {{}, bytes(16000, 1), bytes(32)}, {{1}, bytes(32, 0xEE)}},
      {5, {{}, bytes(65, 1)}, {{9}}},
      {7, {{}, bytes(16000, 0xFF)}, {{1}}},
  };
  const auto expect_refused = [&](size_t index, const bytes& number, bool is_asked) {
    SCOPED_TRACE("number " + std::to_string(index) + ": " + client::to_hex(number).substr(0, 99));
    const bytes blob = ta.import(ANY_USE, altered(index, number), 4 * AMPLE);
    ta.expect_refused(begin_request(SIGN, blob, use(RAW)), -1000,
                      "create_rsa_sign: Resolve key data failed");
    EXPECT_EQ(ta.trace().errors().find("TransientObject") != std::string::npos, is_asked);
    ta.expect_refused(key_request(command::EXPORT_KEY, blob), -1000,
                      "rsa_export_key: resolve key from data stream error");
  };
  for (const auto& [index, malformed, foreign] : rows) {
    for (const bytes& number : malformed)
      expect_refused(index, number, false);
    for (const bytes& number : foreign)
      expect_refused(index, number, true);
  }
}

}  // namespace
}  // namespace keymaster::test
