// RSA through the command interface, against libcrypto: every padding and digest in both
// directions, the limits of messages, keys of every form, and what is refused.
#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using namespace std::string_literals;

constexpr scheme RAW = {KM_PAD_NONE, KM_DIGEST_NONE};
constexpr scheme PKCS1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE};
constexpr scheme PKCS1_SHA1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1};
constexpr scheme PKCS1_ENCRYPT = {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_DIGEST_NONE};
constexpr scheme OAEP_SHA256 = {KM_PAD_RSA_OAEP, KM_DIGEST_SHA_2_256};

const pkey KEY_512 = pkey::rsa(512);
const pkey KEY_1024 = pkey::rsa(1024);
const pkey KEY_2048 = pkey::rsa(2048);
const param_set ANY_USE = any_use(KM_ALGORITHM_RSA);

param_set new_key(uint64_t bits, uint64_t exponent) {
  return one(KM_TAG_KEY_SIZE, bits).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent).append(ANY_USE);
}

bytes text(size_t length) {
  bytes result(length);
  for (size_t i = 0; i < length; i++)
    result[i] = static_cast<uint8_t>(i * 7 + 1);
  return result;
}

// The answers of begin by padding (rows 1 to 5, then one that does not exist) and digest (columns).
constexpr int32_t SIGNATURE_ANSWERS[][UNKNOWN_DIGEST + 1] = {
    {0, -13, -13, -13, -13, -13, -13, -12},
    {-10, -10, -10, -10, -10, -10, -10, -12},
    {-13, -13, 0, 0, 0, 0, 0, -12},
    {-10, -10, -10, -10, -10, -10, -10, -12},
    {0, 0, 0, 0, 0, 0, 0, -12},
    {-10, -10, -10, -10, -10, -10, -10, -12},
};
constexpr int32_t ENCRYPTION_ANSWERS[][UNKNOWN_DIGEST + 1] = {
    {0, -13, -13, -13, -13, -13, -13, -12},   {-13, -13, 0, 0, 0, 0, 0, -12},
    {-10, -10, -10, -10, -10, -10, -10, -12}, {0, -13, -13, -13, -13, -13, -13, -12},
    {-10, -10, -10, -10, -10, -10, -10, -12}, {-10, -10, -10, -10, -10, -10, -10, -12},
};

class Rsa : public testing::Test {
 protected:
  bytes imported(const pkey& key) { return ta.import(ANY_USE, key.import_data()); }
  reply verify(byte_view blob, scheme how, byte_view message, byte_view signature) {
    return ta.try_run(VERIFY, blob, use(how), message, signature);
  }

  // Calls with two keys, and for each with every scheme of a table and its answer.
  template <size_t N, class Row>
  void each_scheme(const int32_t (&answers)[N][UNKNOWN_DIGEST + 1], Row row) {
    for (const pkey* key : {&KEY_1024, &KEY_2048}) {
      const bytes blob = imported(*key);
      for (uint32_t i = 0; i < N * (UNKNOWN_DIGEST + 1); i++) {
        const uint32_t line = i / (UNKNOWN_DIGEST + 1);
        const uint32_t digest = i % (UNKNOWN_DIGEST + 1);
        const uint32_t padding = line + 1 < N ? line + 1 : UNKNOWN_PADDING;
        SCOPED_TRACE("padding " + std::to_string(padding) + ", digest " + std::to_string(digest));
        row(*key, blob, scheme{padding, digest}, answers[line][digest]);
      }
    }
  }

  ta_under_test ta;
};

TEST_F(Rsa, SignaturesAreThoseOfTheStandards) {
  each_scheme(SIGNATURE_ANSWERS, [&](const pkey& key, byte_view blob, scheme how, int32_t answer) {
    if (answer != 0) {
      ta.expect_refused(begin_request(SIGN, blob, use(how)), answer);
      ta.expect_refused(begin_request(VERIFY, blob, use(how)), answer);
      return;
    }
    // Without padding the message is the whole block, whose first byte must be 0.
    const bool raw = how.padding == KM_PAD_NONE;
    const bytes message = raw ? right_aligned(text(key.size() - 1), key.size()) : text(70);
    const bytes made = ta.run(SIGN, blob, use(how), message);
    EXPECT_EQ(made.size(), key.size());
    EXPECT_TRUE(key.verify(how, message, made));
    EXPECT_TRUE(succeeded(verify(blob, how, message, key.sign(how, message))));
    bytes other = message;
    other.back() ^= 1;
    EXPECT_TRUE(refused(verify(blob, how, other, made), -30));
    for (const byte_view cut : {byte_view(made).subspan(1), byte_view()}) {
      EXPECT_TRUE(how.digest == 0 || refused(verify(blob, how, message, cut), -30));
    }
  });
}

TEST_F(Rsa, CiphertextsAreThoseOfTheStandards) {
  each_scheme(ENCRYPTION_ANSWERS, [&](const pkey& key, byte_view blob, scheme how, int32_t answer) {
    // 1024 bits are too short for OAEP with SHA-512: nothing but an error can come of it.
    if (answer != 0 || (key.size() == 128 && how.digest == KM_DIGEST_SHA_2_512)) {
      EXPECT_TRUE(refused(
          answer != 0 ? ta.begin(ENCRYPT, blob, use(how)) : ta.try_run(ENCRYPT, blob, use(how), {}),
          answer != 0 ? answer : -21));
      return;
    }
    const bool raw = how.padding == KM_PAD_NONE;
    const bytes whole = raw ? right_aligned(text(20), key.size()) : text(20);
    const bytes made = ta.run(ENCRYPT, blob, use(how), text(20));
    EXPECT_EQ(made.size(), key.size());
    EXPECT_EQ(key.decrypt(how, made), whole);
    EXPECT_EQ(ta.run(DECRYPT, blob, use(how), key.encrypt(how, whole)), whole);
    EXPECT_EQ(ta.try_run(DECRYPT, blob, use(how), byte_view(made).subspan(1)).km_error,
              raw ? 0 : -38);
  });
  const bytes blob = imported(KEY_512);
  // Nothing but OAEP needs a digest to be named.
  for (const auto& [padding, answer] :
       {std::pair(KM_PAD_NONE, 0), {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, 0}, {KM_PAD_RSA_OAEP, -13}}) {
    const reply begun = ta.try_begin(ENCRYPT, blob, one(KM_TAG_PADDING, padding));
    EXPECT_TRUE(refused(begun, answer)) << padding;
  }
}

TEST_F(Rsa, MessagesHaveLimits) {
  const bytes blob = imported(KEY_2048);
  // What update says when it refuses what is longer; else it is finish that refuses.
  for (const auto& [purpose, how, longest, verb] : {std::tuple(SIGN, PKCS1, 245u, "sign"s),
                                                    {VERIFY, PKCS1, 245, "verify"},
                                                    {SIGN, RAW, 256, "sign"},
                                                    {ENCRYPT, RAW, 256, "encrypt"},
                                                    {DECRYPT, PKCS1_ENCRYPT, 256, "decrypt"},
                                                    {ENCRYPT, PKCS1_ENCRYPT, 245, ""},
                                                    {ENCRYPT, OAEP_SHA256, 190, ""}}) {
    const std::string max = std::to_string(longest) + "B, got ";
    const std::string message = (verb.empty() ? "Message too long, max " + max
                                              : "too long to " + verb + ", key_size 2048, input ") +
                                std::to_string(longest + 1) + "B";
    SCOPED_TRACE(message);
    const uint32_t handle = ta.begun(purpose, blob, use(how));
    EXPECT_TRUE(succeeded(ta.update(handle, text(longest - 1))));
    EXPECT_TRUE(succeeded(ta.update(handle, text(1))));
    const reply over = ta.update(handle, text(1));
    EXPECT_EQ(over.b, verb.empty() ? 1U : 0U);
    EXPECT_TRUE(refused(verb.empty() ? ta.finish(handle) : over, -21));
    EXPECT_NE(ta.trace().errors().find(message), std::string::npos);
    if (verb.empty()) ta.run(purpose, blob, use(how), text(longest));
  }
  const bytes too_big(256, 0xFF);  // not below the modulus
  for (uint32_t purpose : {SIGN, ENCRYPT, DECRYPT}) {
    EXPECT_TRUE(refused(ta.try_run(purpose, blob, use(RAW), too_big), -38)) << purpose;
  }
  EXPECT_TRUE(failed_with(verify(blob, RAW, text(9), too_big), TEEC_ERROR_BAD_PARAMETERS));
}

// Data that is refused is the caller's fault; what else the platform fails with goes out as it is.
TEST_F(Rsa, FailuresOfThePlatformKeepTheirCode) {
  const bytes blob = imported(KEY_512);
  for (uint32_t purpose : {SIGN, ENCRYPT, DECRYPT}) {
    bool seen = false;
    const auto make = [&] {
      return step_request(command::FINISH, ta.begun(purpose, blob, use(RAW)));
    };
    ta.fail_each_call(TEEC_ERROR_BUSY, make, [&](const reply& answer, bool /*fired*/) {
      seen |= answer.res == TEEC_ERROR_BUSY;
    });
    EXPECT_TRUE(seen) << purpose;
  }
}

TEST_F(Rsa, RawResultsHaveTheKeysLength) {
  const bytes blob = imported(KEY_2048);
  // The public operation on what is wanted tells what to sign.
  const bytes wanted = right_aligned(text(200), 256);
  EXPECT_EQ(ta.run(SIGN, blob, use(RAW), KEY_2048.encrypt(RAW, wanted)), wanted);
  const bytes short_message = text(10);
  const bytes made = ta.run(SIGN, blob, use(RAW), short_message);
  EXPECT_EQ(made, KEY_2048.sign(RAW, right_aligned(short_message, 256)));
  // Verification takes the data as it came, at the front of the block.
  EXPECT_TRUE(refused(verify(blob, RAW, short_message, made), -30));
  EXPECT_TRUE(refused(verify(blob, RAW, right_aligned(short_message, 256), made), -30));
  bytes block = {0, 7, 8, 9};
  const bytes front = block;
  block.resize(256);
  EXPECT_TRUE(succeeded(verify(blob, RAW, front, KEY_2048.sign(RAW, block))));
  // What the signature comes to must be all of the block, not what it begins with.
  for (const bytes& power : {bytes(256), right_aligned(bytes{1}, 256)}) {
    EXPECT_TRUE(refused(verify(blob, RAW, bytes{0, 1}, power), -30));
    EXPECT_EQ(ta.run(ENCRYPT, blob, use(RAW), power), power);
  }
  EXPECT_EQ(ta.run(ENCRYPT, blob, use(RAW), {}), bytes(256));
}

TEST_F(Rsa, PssSaltsAreAsLongAsTheDigestOrAsFits) {
  const pkey key_520 = pkey::rsa(520), key_528 = pkey::rsa(528);
  for (const auto& [key, digest, salt] : {std::tuple(&KEY_2048, KM_DIGEST_SHA_2_256, 32),
                                          {&KEY_2048, KM_DIGEST_SHA_2_512, 64},
                                          {&KEY_1024, KM_DIGEST_SHA_2_384, 48},
                                          {&KEY_1024, KM_DIGEST_SHA_2_512, 62},
                                          {&key_528, KM_DIGEST_SHA_2_256, 32},
                                          {&key_520, KM_DIGEST_SHA_2_256, 31},
                                          {&KEY_512, KM_DIGEST_SHA_2_256, 30}}) {
    const scheme how = {KM_PAD_RSA_PSS, digest};
    const bytes blob = imported(*key);
    const bytes made = ta.run(SIGN, blob, use(how), text(99));
    EXPECT_TRUE(key->verify(how, text(99), made, salt)) << salt;
    for (int other : {0, 1, RSA_PSS_SALTLEN_MAX}) {
      EXPECT_TRUE(succeeded(verify(blob, how, text(99), key->sign(how, text(99), other))));
    }
  }
  const bytes small = imported(KEY_512);
  const auto pss = [](uint32_t digest) { return use({KM_PAD_RSA_PSS, digest}); };
  ta.expect_refused(begin_request(VERIFY, small, pss(KM_DIGEST_SHA_2_384)), -13);
  ta.expect_refused(begin_request(VERIFY, small, pss(KM_DIGEST_SHA_2_512)), -13);
  ta.expect_refused(begin_request(SIGN, small, pss(KM_DIGEST_SHA_2_512)), -13,
                    "create_rsa_sign: Too short key to fit digest, flag and salt, "
                    "key_size 512, need 688");
}

// The smallest key takes every digest but with PKCS #1 v1.5 and SHA-512 the block has no room: an
// error, and no harm. The largest ones work.
TEST_F(Rsa, KeysOfEverySizeSign) {
  for (uint32_t bits : {512u, 744u, 752u, 3072u, 4096u}) {
    const pkey key = pkey::rsa(bits);
    const bytes blob = imported(key);
    for (uint32_t digest = KM_DIGEST_SHA_2_256; digest <= KM_DIGEST_SHA_2_512; digest++) {
      SCOPED_TRACE(std::to_string(bits) + " bits, digest " + std::to_string(digest));
      const scheme how = {KM_PAD_RSA_PKCS1_1_5_SIGN, digest};
      const size_t need = 11 + 19 + 16 * (digest - 2);  // padding, DigestInfo and digest
      const bool fits = key.size() >= need;
      const reply made = ta.try_run(SIGN, blob, use(how), text(70));
      EXPECT_EQ(made.ok(), fits);
      EXPECT_EQ(key.verify(how, text(70), finished(made)), fits);
      const bytes signature = fits ? finished(made) : bytes(key.size(), 1);
      EXPECT_EQ(verify(blob, how, text(70), signature).ok(), fits);
    }
  }
}

// A platform may end the TA that has it sign what does not fit: it is not asked. The last key's
// modulus has a single bit in its first byte, which leaves PSS a byte less.
TEST_F(Rsa, WhatDoesNotFitIsNotGivenToThePlatform) {
  const pkey key_1033 = pkey::rsa(1033);
  const scheme pss = {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_512};
  for (const auto& [key, how] :
       {std::pair(&KEY_512, scheme{KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_384}),
        {&KEY_512, scheme{KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_512}},
        {&key_1033, pss}}) {
    const bytes blob = imported(*key);
    const auto finish = [&, how = how] {
      const uint32_t handle = ta.begun(SIGN, blob, use(how));
      ta.update(handle, text(9));
      return step_request(command::FINISH, handle);
    };
    ta.fail_each_call(TEEC_ERROR_BUSY, finish, [&](const reply& answer, bool fired) {
      EXPECT_FALSE(ta.trace().has("rsa_sign_finish: AsymmetricSignDigest failed with 0xffff000d"));
      EXPECT_EQ(answer.res == TEEC_ERROR_BAD_PARAMETERS, !fired);
      EXPECT_EQ(ta.trace().has("rsa_sign_finish: AsymmetricSignDigest failed with 0xffff0006"),
                !fired);
    });
    EXPECT_TRUE(refused(verify(blob, how, text(9), bytes(key->size(), 1)), -30));
  }
  EXPECT_TRUE(key_1033.verify(
      {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256}, text(9),
      ta.run(SIGN, imported(key_1033), use({KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256}), text(9))));
}

TEST_F(Rsa, BeginWantsOnePaddingAndOneDigest) {
  const bytes blob = imported(KEY_512);
  for (const auto& [tag, name] :
       {std::pair(KM_TAG_PADDING, "KM_TAG_PADDING"), {KM_TAG_DIGEST, "KM_TAG_DIGEST"}}) {
    for (const param_set& params : {without(use(PKCS1), tag), use(PKCS1).add(tag, 5)}) {
      ta.expect_refused(begin_request(VERIFY, blob, params), -38,
                        "create_rsa_verify: No or too many "s + name);
    }
  }
  // Digests that nothing knows, in a key that allows them.
  const auto strange = {8u, 0x7FFFFFFFu, 0x80000000u, 0xFFFFFFFFu};
  const bytes lenient = ta.import(with(ANY_USE, KM_TAG_DIGEST, strange), KEY_512.import_data());
  for (uint32_t digest : strange) {
    ta.expect_refused(begin_request(SIGN, lenient, use({KM_PAD_NONE, digest})), -12);
    ta.expect_refused(begin_request(SIGN, lenient, use({KM_PAD_RSA_PSS, digest})), -12);
    ta.expect_refused(begin_request(DECRYPT, lenient, use({KM_PAD_RSA_OAEP, digest})), -12);
  }
}

// Authorisation asks which digest an operation will use: OAEP and signatures have one.
TEST_F(Rsa, KeysAreUsedWithTheirDigestsAlone) {
  const param_set key = with(ANY_USE, KM_TAG_DIGEST, {KM_DIGEST_SHA_2_256});
  const bytes blob = ta.import(key, KEY_1024.import_data());
  for (const auto& [purpose, how, authorized] :
       {std::tuple(DECRYPT, scheme{KM_PAD_RSA_OAEP, KM_DIGEST_SHA1}, false),
        {DECRYPT, OAEP_SHA256, true},
        {DECRYPT, PKCS1_ENCRYPT, true},
        {SIGN, PKCS1_SHA1, false},
        {SIGN, {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256}, true},
        {SIGN, RAW, false}}) {
    const reply begun = ta.try_begin(purpose, blob, use(how));
    EXPECT_TRUE(refused(begun, authorized ? 0 : -13)) << how.padding;
    EXPECT_EQ(ta.trace().has("begin: Authorization failed"), !authorized);
  }
}

TEST_F(Rsa, NewKeysAreChecked) {
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

TEST_F(Rsa, GeneratedKeysWorkAndAreExported) {
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

TEST_F(Rsa, ImportsTellTheirSizeAndExponent) {
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
TEST_F(Rsa, ImportsOfUnusualFormAreUsed) {
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
TEST_F(Rsa, NumbersThatAreNoKeyAreRefusedWhenUsed) {
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
