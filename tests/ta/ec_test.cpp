// EC keys and ECDSA through the command interface: every curve and digest against libcrypto, and
// what is refused.
#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::from_hex;

constexpr scheme SHA1 = {0, KM_DIGEST_SHA1};
constexpr scheme SHA256 = {0, KM_DIGEST_SHA_2_256};
constexpr scheme NO_DIGEST = {0, KM_DIGEST_NONE};

const pkey CURVES[] = {pkey::ec(224), pkey::ec(256), pkey::ec(384), pkey::ec(521)};

// The length of a number of the key in bytes.
size_t width(const pkey& key) {
  return (key.bits() + 7) / 8;
}

const param_set ANY_USE = any_use(KM_ALGORITHM_EC);

class Ec : public testing::Test {
 protected:
  bytes imported(const pkey& key) { return ta.import(ANY_USE, key.import_data()); }
  reply verify(byte_view blob, scheme how, byte_view message, byte_view signature) {
    return ta.try_run(VERIFY, blob, use(how), message, signature);
  }

  ta_under_test ta;
};

TEST_F(Ec, NoOtherSignatureVerifies) {
  for (const pkey& key : CURVES) {
    const bytes blob = imported(key);
    const bytes signature = key.sign(SHA256, as_bytes("sample"));
    EXPECT_TRUE(succeeded(verify(blob, SHA256, as_bytes("sample"), signature))) << key.bits();
    EXPECT_TRUE(refused(verify(blob, SHA256, as_bytes("simple"), signature), -30));
    std::vector<bytes> others;
    for (size_t size : {size_t{0}, size_t{1}, signature.size() - 1, signature.size() + 1})
      others.emplace_back(signature).resize(size);
    for (size_t bit = 0; bit < signature.size() * 8; bit += 5) {
      uint8_t& changed = others.emplace_back(signature)[bit / 8];
      changed = static_cast<uint8_t>(changed ^ 1 << bit % 8);
    }
    for (const bytes& other : others) {
      EXPECT_TRUE(refused(verify(blob, SHA256, as_bytes("sample"), other), -30)) << key.bits();
    }
  }
}

TEST_F(Ec, SignaturesAreThoseOfTheStandards) {
  for (const pkey& key : CURVES) {
    const bytes blob = imported(key);
    for (uint32_t digest = KM_DIGEST_NONE; digest <= UNKNOWN_DIGEST; digest++) {
      const scheme how = {0, digest};
      SCOPED_TRACE(std::to_string(key.bits()) + " bits, digest " + std::to_string(digest));
      if (digest == KM_DIGEST_MD5 || digest == UNKNOWN_DIGEST) {
        const int32_t error = digest == KM_DIGEST_MD5 ? -13 : -12;
        ta.expect_refused(begin_request(SIGN, blob, use(how)), error);
        ta.expect_refused(begin_request(VERIFY, blob, use(how)), error);
        continue;
      }
      // What is not hashed may be shorter than the curve, and is no longer than it.
      const bytes message(digest == KM_DIGEST_NONE ? width(key) : 200, 0xA7);
      for (int i = 0; i < 4; i++) {
        const bytes made = ta.run(SIGN, blob, use(how), message);
        EXPECT_TRUE(key.verify(how, message, made));
        EXPECT_TRUE(succeeded(verify(blob, how, message, key.sign(how, message))));
      }
      const byte_view part = byte_view(message).first(11);
      EXPECT_TRUE(key.verify(how, part, ta.run(SIGN, blob, use(how), part)));
    }
  }
}

TEST_F(Ec, DataThatIsNotHashedIsCutToTheCurve) {
  for (const pkey& key : CURVES) {
    const bytes blob = imported(key);
    const uint32_t handle = ta.begun(SIGN, blob, use(NO_DIGEST));
    const bytes message(100, 0xC5);
    EXPECT_EQ(ta.update(handle, byte_view(message).first(20)).b, 20U);
    EXPECT_EQ(ta.update(handle, byte_view(message).subspan(20)).b, width(key) - 20);
    EXPECT_EQ(ta.update(handle, message).b, 0U);
    const bytes made = finished(ta.finish(handle, message));  // whose data is not signed either
    EXPECT_TRUE(key.verify(NO_DIGEST, byte_view(message).first(width(key)), made));
  }
}

TEST_F(Ec, NewKeysAreChecked) {
  const bytes data = CURVES[1].import_data();
  bytes small = data;
  small[0] = 192;  // of a size field of 256
  small[1] = 0;
  const auto size = [](uint32_t bits) { return with(ANY_USE, KM_TAG_KEY_SIZE, {bits}); };
  const bad_key rows[] = {
      {ANY_USE, -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      // The size comes first, whatever else is wrong.
      {size(192).add(KM_TAG_ORIGIN, 0), -6, "Invalid EC key size 192"},
      {size(256).add(KM_TAG_ORIGIN, 0), -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {size(256).add(KM_TAG_EC_CURVE, 1), -38, "Shouldn't specify KM_TAG_EC_CURVE"},
      {size(384), -44, "Key size mismatch (given 384, guessed 256)", data},
      {ANY_USE, -6, "Invalid EC key size 192", small},
      {with(ANY_USE, KM_TAG_EC_CURVE, {1}), -38, "Shouldn't specify KM_TAG_EC_CURVE", data},
  };
  ta.expect_refused_keys("ec_", rows);
}

TEST_F(Ec, KeysAreDescribedAndExported) {
  for (const pkey& key : CURVES) {
    const bytes generated = ta.generate(with(ANY_USE, KM_TAG_KEY_SIZE, {key.bits()}));
    bytes trailing = key.import_data();
    trailing.push_back(9);
    const bytes taken = ta.import(ANY_USE, trailing);
    EXPECT_EQ(generated.size(), taken.size()) << "records of one size";
    for (const auto& [blob, origin] :
         {std::pair(generated, KM_ORIGIN_GENERATED), {taken, KM_ORIGIN_IMPORTED}}) {
      const param_set found = ta.characteristics(blob);
      EXPECT_EQ(found.number(KM_TAG_KEY_SIZE), key.bits());
      EXPECT_EQ(found.number(KM_TAG_EC_CURVE), &key - CURVES);  // KM_EC_CURVE_P_224 is 0
      EXPECT_EQ(found.number(KM_TAG_ORIGIN), origin);
      EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
      const reply exported = ta.send_well(key_request(command::EXPORT_KEY, blob));
      const pkey found_key = pkey::ec_public(exported.output());
      const bytes signature = ta.run(SIGN, blob, use(SHA1), as_bytes("a"));
      EXPECT_TRUE(found_key.verify(SHA1, as_bytes("a"), signature));
    }
  }
}

TEST_F(Ec, NumbersThatAreNoKeyAreRefusedWhenUsed) {
  const pkey& key = CURVES[1];
  const bytes x = key.number(OSSL_PKEY_PARAM_EC_PUB_X);
  const bytes y = key.number(OSSL_PKEY_PARAM_EC_PUB_Y);
  const bytes order = from_hex("ffffffff00000000ffffffffffffffffbce6faada7179e84f3b9cac2fc632551");
  const bytes too_long(33, 0x11);
  const bytes zero(32);
  using numbers = std::vector<std::map<size_t, bytes>>;
  // What the platform sees, and lengths that it does not see: it may end a TA that hands them over.
  const numbers foreign = {{{0, y}, {1, x}}, {{2, order}}, {{0, {1}}}};
  const numbers malformed = {{{2, zero}},     {{0, {}}},
                             {{1, {}}},       {{2, {}}},
                             {{0, too_long}}, {{1, too_long}},
                             {{2, too_long}}, {{0, bytes(60000, 1)}},
                             {{0, zero}},     {{0, zero}, {1, zero}}};
  for (const numbers* broken : {&foreign, &malformed}) {
    for (const auto& replaced : *broken) {
      const bytes blob = ta.import(ANY_USE, key.import_data(replaced), 2 * 60000);
      ta.expect_refused(begin_request(SIGN, blob, use(SHA1)), -1000,
                        "create_ec_sign: Resolve key data failed");
      const bool is_asked = ta.trace().errors().find("TransientObject") != std::string::npos;
      EXPECT_EQ(is_asked, broken == &foreign);
    }
  }
  // Zeros in front change nothing.
  const bytes blob =
      ta.import(ANY_USE, key.import_data({{0, right_aligned(x, 40)}, {1, right_aligned(y, 40)}}));
  const bytes made = ta.run(SIGN, blob, use(SHA256), as_bytes("sample"));
  EXPECT_TRUE(key.verify(SHA256, as_bytes("sample"), made));
  for (const param_set& params : {param_set(), several(KM_TAG_DIGEST, {4, 4})}) {
    ta.expect_refused(begin_request(VERIFY, imported(key), params), -38,
                      "create_ec_verify: No or too many KM_TAG_DIGEST");
  }
  ta.expect_refused(begin_request(ENCRYPT, imported(key), use(SHA256)), -2);
}

}  // namespace
}  // namespace keymaster::test
