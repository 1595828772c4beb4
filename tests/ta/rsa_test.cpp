// RSA through the command interface, against libcrypto: every padding and digest in both
// directions, the limits of messages, and what is refused.
#include "ta/rsa.h"

namespace keymaster::test {
namespace {

using namespace std::string_literals;

const pkey KEY_512 = pkey::rsa(512);
const pkey KEY_1024 = pkey::rsa(1024);
const pkey KEY_2048 = pkey::rsa(2048);

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

class Rsa : public rsa_device {
 protected:
  bytes imported(const pkey& key) { return ta.import(ANY_USE, key.import_data()); }

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

}  // namespace
}  // namespace keymaster::test
