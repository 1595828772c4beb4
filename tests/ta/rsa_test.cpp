// RSA through the command interface, against libcrypto: every padding and digest in both
// directions, the limits of messages, keys of every form, and what is refused.
#include "support/sets.h"
#include "support/ta_under_test.h"
#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

constexpr uint32_t UNKNOWN_DIGEST = 7;
constexpr uint32_t UNKNOWN_PADDING = 9;

constexpr scheme RAW = {KM_PAD_NONE, KM_DIGEST_NONE};
constexpr scheme PKCS1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE};
constexpr scheme PKCS1_SHA1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1};
constexpr scheme PKCS1_ENCRYPT = {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_DIGEST_NONE};
constexpr scheme OAEP_SHA256 = {KM_PAD_RSA_OAEP, KM_DIGEST_SHA_2_256};

const pkey& key_512() {
  static const pkey key = pkey::rsa(512);
  return key;
}

const pkey& key_1024() {
  static const pkey key = pkey::rsa(1024);
  return key;
}

const pkey& key_2048() {
  static const pkey key = pkey::rsa(2048);
  return key;
}

// A key for every purpose, padding and digest.
param_set any_use() {
  param_set key = one(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA).add_flag(KM_TAG_NO_AUTH_REQUIRED);
  for (uint32_t purpose = KM_PURPOSE_ENCRYPT; purpose <= KM_PURPOSE_VERIFY; purpose++)
    key.add(KM_TAG_PURPOSE, purpose);
  for (uint32_t padding = KM_PAD_NONE; padding <= UNKNOWN_PADDING; padding++)
    key.add(KM_TAG_PADDING, padding);
  for (uint32_t digest = KM_DIGEST_NONE; digest <= UNKNOWN_DIGEST; digest++)
    key.add(KM_TAG_DIGEST, digest);
  return key;
}

param_set new_key(uint64_t bits, uint64_t exponent) {
  return any_use().add(KM_TAG_KEY_SIZE, bits).add(KM_TAG_RSA_PUBLIC_EXPONENT, exponent);
}

param_set use(scheme how) {
  return one(KM_TAG_PADDING, how.padding).add(KM_TAG_DIGEST, how.digest);
}

bytes text(size_t length) {
  bytes result(length);
  for (size_t i = 0; i < length; i++)
    result[i] = static_cast<uint8_t>(i * 7 + 1);
  return result;
}

class Rsa : public testing::Test {
 protected:
  bytes imported(const pkey& key) { return ta.import(any_use(), key.import_data()); }

  // begin and update of a signature's verification; returns what finish answers to `signature`.
  reply verify(byte_view blob, scheme how, byte_view message, byte_view signature) {
    const uint32_t handle = ta.begun(KM_PURPOSE_VERIFY, blob, use(how));
    EXPECT_TRUE(succeeded(ta.update(handle, message))) << ta.trace().errors();
    return ta.finish(handle, signature);
  }

  ta_under_test ta;
};

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

// Calls with every scheme of a table and its answer.
template <size_t N, class Row>
void each_scheme(const int32_t (&answers)[N][UNKNOWN_DIGEST + 1], Row row) {
  for (uint32_t i = 0; i < N; i++) {
    for (uint32_t digest = 0; digest <= UNKNOWN_DIGEST; digest++) {
      const uint32_t padding = i + 1 < N ? i + 1 : UNKNOWN_PADDING;
      SCOPED_TRACE("padding " + std::to_string(padding) + ", digest " + std::to_string(digest));
      row(scheme{padding, digest}, answers[i][digest]);
    }
  }
}

TEST_F(Rsa, SignaturesAreThoseOfTheStandards) {
  for (const pkey* key : {&key_1024(), &key_2048()}) {
    const bytes blob = imported(*key);
    each_scheme(SIGNATURE_ANSWERS, [&](scheme how, int32_t answer) {
      if (answer != 0) {
        EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, use(how)), answer));
        EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_VERIFY, blob, use(how)), answer));
        return;
      }
      // Without padding the message is the whole block, whose first byte must be 0.
      const bool raw = how.padding == KM_PAD_NONE;
      const bytes message = raw ? right_aligned(text(key->size() - 1), key->size()) : text(70);
      const bytes made = ta.run(KM_PURPOSE_SIGN, blob, use(how), message);
      EXPECT_EQ(made.size(), key->size());
      EXPECT_TRUE(key->verify(how, message, made));
      const bytes foreign = key->sign(how, message);
      EXPECT_TRUE(succeeded(verify(blob, how, message, foreign)));
      bytes other = message;
      other.back() ^= 1;
      EXPECT_TRUE(refused(verify(blob, how, other, made), -30));
      EXPECT_TRUE(how.digest == 0 ||
                  refused(verify(blob, how, message, byte_view(made).subspan(1)), -30));
    });
  }
}

TEST_F(Rsa, CiphertextsAreThoseOfTheStandards) {
  for (const pkey* key : {&key_1024(), &key_2048()}) {
    const bytes blob = imported(*key);
    each_scheme(ENCRYPTION_ANSWERS, [&](scheme how, int32_t answer) {
      // 1024 bits are too short for OAEP with SHA-512: nothing but an error can come of it.
      if (answer != 0 || (key->size() == 128 && how.digest == KM_DIGEST_SHA_2_512)) {
        const int32_t error = answer != 0 ? answer : -21;
        const reply begun = ta.begin(KM_PURPOSE_ENCRYPT, blob, use(how));
        EXPECT_TRUE(refused(answer != 0 ? begun : ta.finish(begun.b), error));
        return;
      }
      const bool raw = how.padding == KM_PAD_NONE;
      const bytes message = text(20);
      const bytes whole = raw ? right_aligned(message, key->size()) : message;
      const bytes made = ta.run(KM_PURPOSE_ENCRYPT, blob, use(how), message);
      EXPECT_EQ(made.size(), key->size());
      EXPECT_EQ(key->decrypt(how, made), whole);
      EXPECT_EQ(ta.run(KM_PURPOSE_DECRYPT, blob, use(how), key->encrypt(how, whole)), whole);
      const uint32_t handle = ta.begun(KM_PURPOSE_DECRYPT, blob, use(how));
      EXPECT_TRUE(succeeded(ta.update(handle, byte_view(made).subspan(1))));
      EXPECT_EQ(ta.finish(handle).km_error, raw ? 0 : -38);
    });
    // Nothing but OAEP needs a digest to be named.
    for (const auto& [padding, answer] :
         {std::pair(KM_PAD_NONE, 0), {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, 0}, {KM_PAD_RSA_OAEP, -13}}) {
      const reply begun = ta.begin(KM_PURPOSE_ENCRYPT, blob, one(KM_TAG_PADDING, padding));
      EXPECT_TRUE(refused(begun, answer)) << padding;
      if (begun.ok()) ta.abort(begun.b);
    }
  }
}

TEST_F(Rsa, MessagesHaveLimits) {
  const bytes blob = imported(key_2048());
  const struct {
    uint32_t purpose;
    scheme how;
    size_t longest;
    bool at_update;  // else it is finish that refuses what is longer
    const char* message;
  } rows[] = {
      {KM_PURPOSE_SIGN, PKCS1, 245, true, "too long to sign, key_size 2048, input 246B"},
      {KM_PURPOSE_VERIFY, PKCS1, 245, true, "too long to verify, key_size 2048, input 246B"},
      {KM_PURPOSE_SIGN, RAW, 256, true, "too long to sign, key_size 2048, input 257B"},
      {KM_PURPOSE_ENCRYPT, RAW, 256, true, "too long to encrypt, key_size 2048, input 257B"},
      {KM_PURPOSE_DECRYPT, PKCS1_ENCRYPT, 256, true,
       "too long to decrypt, key_size 2048, input 257B"},
      {KM_PURPOSE_ENCRYPT, PKCS1_ENCRYPT, 245, false, "Message too long, max 245B, got 246B"},
      {KM_PURPOSE_ENCRYPT, OAEP_SHA256, 190, false, "Message too long, max 190B, got 191B"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.message);
    const uint32_t handle = ta.begun(row.purpose, blob, use(row.how));
    EXPECT_TRUE(succeeded(ta.update(handle, text(row.longest - 1))));
    EXPECT_TRUE(succeeded(ta.update(handle, text(1))));
    const reply over = ta.update(handle, text(1));
    EXPECT_EQ(over.b, row.at_update ? 0U : 1U);
    EXPECT_TRUE(refused(row.at_update ? over : ta.finish(handle), -21));
    EXPECT_NE(ta.trace().errors().find(row.message), std::string::npos);
    if (!row.at_update) ta.run(row.purpose, blob, use(row.how), text(row.longest));
  }
  const bytes too_big(256, 0xFF);  // not below the modulus
  for (uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
    const uint32_t handle = ta.begun(purpose, blob, use(RAW));
    EXPECT_TRUE(succeeded(ta.update(handle, too_big)));
    EXPECT_TRUE(refused(ta.finish(handle), -38)) << purpose;
  }
  EXPECT_TRUE(failed_with(verify(blob, RAW, text(9), too_big), TEEC_ERROR_BAD_PARAMETERS));
}

// Data that is refused is the caller's fault; what else the platform fails with goes out as it is.
TEST_F(Rsa, FailuresOfThePlatformKeepTheirCode) {
  const bytes blob = imported(key_512());
  for (uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
    bool seen = false;
    bool fired = true;
    for (uint64_t n = 1; fired; n++) {
      const uint32_t handle = ta.begun(purpose, blob, use(RAW));
      tee::host::fail_nth_call(n, TEEC_ERROR_BUSY);
      seen |= ta.finish(handle).res == TEEC_ERROR_BUSY;
      fired = tee::host::fault_fired();
      tee::host::clear_fault();
    }
    EXPECT_TRUE(seen) << purpose;
  }
}

TEST_F(Rsa, RawResultsHaveTheKeysLength) {
  const bytes blob = imported(key_2048());
  // The public operation on what is wanted tells what to sign.
  const bytes wanted = right_aligned(text(200), 256);
  EXPECT_EQ(ta.run(KM_PURPOSE_SIGN, blob, use(RAW), key_2048().encrypt(RAW, wanted)), wanted);
  const bytes short_message = text(10);
  const bytes made = ta.run(KM_PURPOSE_SIGN, blob, use(RAW), short_message);
  EXPECT_EQ(made, key_2048().sign(RAW, right_aligned(short_message, 256)));
  // Verification takes the data as it came, at the front of the block.
  EXPECT_TRUE(refused(verify(blob, RAW, short_message, made), -30));
  EXPECT_TRUE(refused(verify(blob, RAW, right_aligned(short_message, 256), made), -30));
  EXPECT_EQ(ta.run(KM_PURPOSE_ENCRYPT, blob, use(RAW), {}), bytes(256));
}

TEST_F(Rsa, PssSaltsAreAsLongAsTheDigestOrAsFits) {
  const struct {
    const pkey& key;
    uint32_t digest;
    int salt;
  } rows[] = {{key_2048(), KM_DIGEST_SHA_2_256, 32},
              {key_2048(), KM_DIGEST_SHA_2_512, 64},
              {key_1024(), KM_DIGEST_SHA_2_384, 48},
              {key_1024(), KM_DIGEST_SHA_2_512, 62},
              {key_512(), KM_DIGEST_SHA_2_256, 30}};
  for (const auto& row : rows) {
    const scheme how = {KM_PAD_RSA_PSS, row.digest};
    const bytes blob = imported(row.key);
    const bytes made = ta.run(KM_PURPOSE_SIGN, blob, use(how), text(99));
    EXPECT_TRUE(row.key.verify(how, text(99), made, row.salt)) << row.salt;
    for (int salt : {0, 1, RSA_PSS_SALTLEN_MAX}) {
      EXPECT_TRUE(succeeded(verify(blob, how, text(99), row.key.sign(how, text(99), salt))));
    }
  }
  for (uint32_t digest : {KM_DIGEST_SHA_2_384, KM_DIGEST_SHA_2_512}) {
    const param_set pss = use({KM_PAD_RSA_PSS, digest});
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_VERIFY, imported(key_512()), pss), -13));
  }
  const param_set pss = use({KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_512});
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, imported(key_512()), pss), -13));
  EXPECT_TRUE(
      ta.trace().has("create_rsa_sign: Too short key to fit digest, flag and salt, "
                     "key_size 512, need 688"));
}

// The smallest key takes every digest but with PKCS #1 v1.5 and SHA-512 the block has no room: an
// error, and no harm. The largest ones work.
TEST_F(Rsa, KeysOfEverySizeSign) {
  for (uint32_t bits : {512u, 752u, 3072u, 4096u}) {
    const pkey key = pkey::rsa(bits);
    const bytes blob = imported(key);
    for (uint32_t digest = KM_DIGEST_SHA_2_256; digest <= KM_DIGEST_SHA_2_512; digest++) {
      SCOPED_TRACE(std::to_string(bits) + " bits, digest " + std::to_string(digest));
      const scheme how = {KM_PAD_RSA_PKCS1_1_5_SIGN, digest};
      const size_t need = 11 + 19 + 16 * (digest - 2);  // padding, DigestInfo and digest
      if (key.size() >= need) {
        const bytes made = ta.run(KM_PURPOSE_SIGN, blob, use(how), text(70));
        EXPECT_TRUE(key.verify(how, text(70), made));
        EXPECT_TRUE(succeeded(verify(blob, how, text(70), made)));
        continue;
      }
      const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, use(how));
      EXPECT_TRUE(succeeded(ta.update(handle, text(70))));
      EXPECT_FALSE(ta.finish(handle).ok());
      EXPECT_FALSE(verify(blob, how, text(70), bytes(key.size(), 1)).ok());
    }
  }
}

TEST_F(Rsa, BeginWantsOnePaddingAndOneDigest) {
  const bytes blob = imported(key_512());
  for (const auto& [tag, name] :
       {std::pair(KM_TAG_PADDING, "KM_TAG_PADDING"), {KM_TAG_DIGEST, "KM_TAG_DIGEST"}}) {
    for (const param_set& params : {without(use(PKCS1), tag), use(PKCS1).add(tag, 5)}) {
      EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_VERIFY, blob, params), -38));
      EXPECT_TRUE(ta.trace().has(std::string("create_rsa_verify: No or too many ") + name));
    }
  }
  // Digests that nothing knows, in a key that allows them.
  const uint32_t strange[] = {8, 0x7FFFFFFF, 0x80000000, 0xFFFFFFFF};
  param_set key = any_use();
  for (uint32_t digest : strange)
    key.add(KM_TAG_DIGEST, digest);
  const bytes lenient = ta.import(key, key_512().import_data());
  for (uint32_t digest : strange) {
    for (uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_OAEP}) {
      const uint32_t purpose = padding == KM_PAD_RSA_OAEP ? KM_PURPOSE_DECRYPT : KM_PURPOSE_SIGN;
      EXPECT_TRUE(refused(ta.begin(purpose, lenient, use({padding, digest})), -12)) << digest;
    }
  }
}

// Authorisation asks which digest an operation will use: OAEP and signatures have one.
TEST_F(Rsa, KeysAreUsedWithTheirDigestsAlone) {
  const param_set key = without(any_use(), KM_TAG_DIGEST).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  const bytes blob = ta.import(key, key_1024().import_data());
  const struct {
    uint32_t purpose;
    scheme how;
    bool authorized;
  } rows[] = {{KM_PURPOSE_DECRYPT, {KM_PAD_RSA_OAEP, KM_DIGEST_SHA1}, false},
              {KM_PURPOSE_DECRYPT, OAEP_SHA256, true},
              {KM_PURPOSE_DECRYPT, PKCS1_ENCRYPT, true},
              {KM_PURPOSE_SIGN, PKCS1_SHA1, false},
              {KM_PURPOSE_SIGN, {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256}, true},
              {KM_PURPOSE_SIGN, RAW, false}};
  for (const auto& row : rows) {
    const reply begun = ta.begin(row.purpose, blob, use(row.how));
    EXPECT_TRUE(refused(begun, row.authorized ? 0 : -13)) << row.how.padding;
    EXPECT_EQ(ta.trace().has("begin: Authorization failed"), !row.authorized);
    if (begun.ok()) ta.abort(begun.b);
  }
}

TEST_F(Rsa, NewKeysAreChecked) {
  const std::string no_exponent = "No or too many KM_TAG_RSA_PUBLIC_EXPONENT specified";
  const std::string no_size = "No or too many KM_TAG_KEY_SIZE or specified";
  const param_set good = new_key(512, 65537);
  const struct {
    param_set description;
    int32_t error;
    std::string message;
  } rows[] = {
      {param_set(good).add(KM_TAG_ORIGIN, 0), -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {param_set(good).add(KM_TAG_CREATION_DATETIME, 1), -38,
       "Shouldn't specify KM_TAG_CREATION_DATETIME"},
      {without(good, KM_TAG_RSA_PUBLIC_EXPONENT), -38, no_exponent},
      {param_set(good).add(KM_TAG_RSA_PUBLIC_EXPONENT, 3), -38, no_exponent},
      {without(good, KM_TAG_KEY_SIZE), -38, no_size},
      {param_set(good).add(KM_TAG_KEY_SIZE, 512), -38, no_size},
      {new_key(8200, 65537), -6, "Invalid RSA key size 8200"},
      {new_key(513, 65537), -6, "Invalid RSA key size 513"},
  };
  for (const auto& row : rows) {
    EXPECT_TRUE(refused(ta.send(generate_request(row.description)), row.error)) << row.message;
    EXPECT_TRUE(ta.trace().has("rsa_generate_key: " + row.message)) << ta.trace().errors();
  }
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
  const scheme how = {KM_PAD_RSA_PSS, KM_DIGEST_SHA_2_256};
  for (const auto& [bits, exponent] : {std::pair(1024, 3), {2048, 65537}}) {
    const bytes blob = ta.generate(new_key(bits, exponent));
    const param_set found = ta.characteristics(blob);
    EXPECT_EQ(found.number(KM_TAG_ORIGIN), KM_ORIGIN_GENERATED);
    EXPECT_EQ(found.number(KM_TAG_OS_VERSION), OS_VERSION);
    EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
    const reply exported = ta.send(key_request(command::EXPORT_KEY, blob));
    ASSERT_TRUE(succeeded(exported));
    const pkey key = pkey::rsa_public(exported.output());
    EXPECT_EQ(key.number(OSSL_PKEY_PARAM_RSA_E), (exponent == 3 ? bytes{3} : bytes{1, 0, 1}));
    EXPECT_EQ(key.size() * 8, static_cast<size_t>(bits));
    EXPECT_TRUE(key.verify(how, text(5), ta.run(KM_PURPOSE_SIGN, blob, use(how), text(5))));
    const size_t size = exported.output().size();
    EXPECT_TRUE(refused(ta.send(key_request(command::EXPORT_KEY, blob, {}, size - 1)), -1000));
  }
}

// The import data of a 512-bit key with some of its eight numbers replaced.
bytes altered(std::initializer_list<std::pair<size_t, bytes>> changes) {
  const bytes good = key_512().import_data();
  client::field_reader in(good);
  client::field_writer out;
  for (size_t i = 0; i < 8; i++) {
    const byte_view field = in.field();
    bytes number(field.begin(), field.end());
    for (const auto& [index, value] : changes) {
      if (index == i) number = value;
    }
    out.field(number);
  }
  return out.take();
}

constexpr size_t MODULUS = 0;
constexpr size_t EXPONENT = 1;
const bytes E_LONG = {0, 0, 0, 0, 0, 0, 1, 0, 1};  // nine bytes

TEST_F(Rsa, ImportsTellTheirSizeAndExponent) {
  const bytes modulus = key_512().number(OSSL_PKEY_PARAM_RSA_N);
  const auto exponent = [](uint64_t e) { return any_use().add(KM_TAG_RSA_PUBLIC_EXPONENT, e); };
  const struct {
    param_set description;
    bytes data;
    int32_t error;
    std::string message;
    uint32_t bits;  // of a key that is taken; its exponent is 65537
  } rows[] = {
      {any_use().add(KM_TAG_KEY_SIZE, 512), altered({}), 0, "", 512},
      {any_use(), altered({{MODULUS, right_aligned(modulus, 65)}}), 0, "", 520},
      {any_use(), altered({{MODULUS, bytes()}}), 0, "", 0},
      {any_use(), altered({{EXPONENT, E_LONG}}), 0, "", 512},
      {exponent(65537), altered({{EXPONENT, {0, 1, 0, 1}}}), 0, "", 512},
      {exponent(3), altered({}), -44, "Public exponent mismatch", 0},
      {exponent(65537), altered({{EXPONENT, E_LONG}}), -44, "Public exponent mismatch", 0},
      {any_use(), altered({{EXPONENT, bytes(9, 1)}}), -44, "Public exponent mismatch", 0},
      {any_use().add(KM_TAG_KEY_SIZE, 511), altered({}), -44,
       "Key size mismatch (given 511, guessed 512)", 0},
      {any_use(), altered({{MODULUS, bytes(1025, 1)}}), -6, "Invalid RSA key size 8200", 0},
      {any_use().add(KM_TAG_OS_VERSION, 1), altered({}), -38, "Shouldn't specify KM_TAG_OS_VERSION",
       0},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.message + std::to_string(row.bits));
    const reply answer = ta.send(import_request(row.description, row.data));
    ASSERT_TRUE(refused(answer, row.error)) << ta.trace().errors();
    EXPECT_TRUE(row.error == 0 || ta.trace().has("rsa_import_key: " + row.message));
    if (row.error != 0) continue;
    client::key_result result;
    client::parse_imported(answer.output(), &result);
    const param_set found = ta.characteristics(result.blob);
    EXPECT_EQ(found.numbers(KM_TAG_KEY_SIZE), std::vector<uint64_t>{row.bits});
    EXPECT_EQ(found.numbers(KM_TAG_RSA_PUBLIC_EXPONENT), std::vector<uint64_t>{65537});
    EXPECT_EQ(found.number(KM_TAG_ORIGIN), KM_ORIGIN_IMPORTED);
    EXPECT_FALSE(found.contains(KM_TAG_CREATION_DATETIME));
  }
  const bytes dated = ta.import(any_use().add(KM_TAG_CREATION_DATETIME, 77), altered({}));
  EXPECT_EQ(ta.characteristics(dated).number(KM_TAG_CREATION_DATETIME), 77U);
}

TEST_F(Rsa, ImportsOfUnusualFormAreUsed) {
  const bytes modulus = key_512().number(OSSL_PKEY_PARAM_RSA_N);
  const bytes longer = ta.import(any_use(), altered({{MODULUS, right_aligned(modulus, 65)}}));
  EXPECT_EQ(ta.run(KM_PURPOSE_SIGN, longer, use(PKCS1_SHA1), text(3)),
            key_512().sign(PKCS1_SHA1, text(3)));
  EXPECT_EQ(ta.run(KM_PURPOSE_ENCRYPT, longer, use(RAW), text(1)).size(), 65U);
  const bytes no_primes =
      ta.import(any_use(), altered({{3, {}}, {4, {}}, {5, {}}, {6, {}}, {7, {}}}));
  EXPECT_EQ(ta.run(KM_PURPOSE_SIGN, no_primes, use(PKCS1), text(3)),
            key_512().sign(PKCS1, text(3)));
}

TEST_F(Rsa, NumbersThatAreNoKeyAreRefusedWhenUsed) {
  bytes even = key_512().number(OSSL_PKEY_PARAM_RSA_N);
  even.back() ^= 1;
  const bytes broken[] = {
      altered({{MODULUS, {}}}),
      altered({{MODULUS, even}}),
      altered({{MODULUS, bytes(64)}}),
      altered({{MODULUS, {0x0b}}}),
      altered({{MODULUS, bytes(64, 0xFF)}}),
      altered({{EXPONENT, {1}}}),
      altered({{EXPONENT, {3}}}),
      altered({{2, {5}}}),
      altered({{3, {1}}}),
      altered({{5, {9}}}),
      altered({{EXPONENT, {4}}}),
      altered({{EXPONENT, {}}}),
      altered({{2, {}}}),
      altered({{2, bytes(200, 0xEE)}}),
      altered({{3, bytes(32, 0xEE)}}),
      altered({{7, {1}}}),
      altered({{3, {}}}),
  };
  for (size_t i = 0; i < std::size(broken); i++) {
    const bytes blob = ta.import(any_use(), broken[i]);
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, use(RAW)), -1000)) << i;
    EXPECT_TRUE(ta.trace().has("create_rsa_sign: Resolve key data failed")) << i;
    EXPECT_TRUE(refused(ta.send(key_request(command::EXPORT_KEY, blob)), -1000)) << i;
    EXPECT_TRUE(ta.trace().has("rsa_export_key: resolve key from data stream error")) << i;
  }
}

}  // namespace
}  // namespace keymaster::test
