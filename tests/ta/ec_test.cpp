// EC keys and ECDSA through the command interface: every curve and digest against libcrypto, and
// what is refused.
#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::from_hex;

struct curve_row {
  uint32_t bits;
  uint32_t km_curve;
  pkey key = pkey::ec(bits);

  size_t size() const { return (bits + 7) / 8; }
};
const curve_row CURVES[] = {{224, KM_EC_CURVE_P_224},
                            {256, KM_EC_CURVE_P_256},
                            {384, KM_EC_CURVE_P_384},
                            {521, KM_EC_CURVE_P_521}};

const param_set ANY_USE = any_use(KM_ALGORITHM_EC);

param_set use(uint32_t digest) {
  return one(KM_TAG_DIGEST, digest);
}

class Ec : public testing::Test {
 protected:
  bytes imported(const curve_row& row) { return ta.import(ANY_USE, row.key.import_data()); }
  reply verify(byte_view blob, uint32_t digest, byte_view message, byte_view signature) {
    return ta.try_run(VERIFY, blob, use(digest), message, signature);
  }

  ta_under_test ta;
};

TEST_F(Ec, NoOtherSignatureVerifies) {
  const scheme how = {0, KM_DIGEST_SHA_2_256};
  for (const curve_row& row : CURVES) {
    const bytes blob = imported(row);
    const bytes signature = row.key.sign(how, as_bytes("sample"));
    const auto expect_invalid = [&](const bytes& other) {
      EXPECT_TRUE(refused(verify(blob, how.digest, as_bytes("sample"), other), -30)) << row.bits;
    };
    EXPECT_TRUE(succeeded(verify(blob, how.digest, as_bytes("sample"), signature))) << row.bits;
    EXPECT_TRUE(refused(verify(blob, how.digest, as_bytes("simple"), signature), -30));
    for (size_t bit = 0; bit < signature.size() * 8; bit += 5) {
      bytes other = signature;
      other[bit / 8] = static_cast<uint8_t>(other[bit / 8] ^ 1 << bit % 8);
      expect_invalid(other);
    }
    for (size_t size : {size_t{0}, size_t{1}, signature.size() - 1, signature.size() + 1}) {
      bytes other = signature;
      other.resize(size);
      expect_invalid(other);
    }
  }
}

TEST_F(Ec, SignaturesAreThoseOfTheStandards) {
  for (const curve_row& row : CURVES) {
    const pkey& key = row.key;
    const bytes blob = imported(row);
    for (uint32_t digest = KM_DIGEST_NONE; digest <= UNKNOWN_DIGEST; digest++) {
      SCOPED_TRACE(std::to_string(row.bits) + " bits, digest " + std::to_string(digest));
      if (digest == KM_DIGEST_MD5 || digest == UNKNOWN_DIGEST) {
        const int32_t error = digest == KM_DIGEST_MD5 ? -13 : -12;
        ta.expect_refused(begin_request(SIGN, blob, use(digest)), error);
        ta.expect_refused(begin_request(VERIFY, blob, use(digest)), error);
        continue;
      }
      // What is not hashed may be shorter than the curve, and is no longer than it.
      const bytes message(digest == KM_DIGEST_NONE ? row.size() : 200, 0xA7);
      for (int i = 0; i < 4; i++) {
        const bytes made = ta.run(SIGN, blob, use(digest), message);
        EXPECT_TRUE(key.verify({0, digest}, message, made));
        EXPECT_TRUE(succeeded(verify(blob, digest, message, key.sign({0, digest}, message))));
      }
      const byte_view part = byte_view(message).first(11);
      EXPECT_TRUE(key.verify({0, digest}, part, ta.run(SIGN, blob, use(digest), part)));
    }
  }
}

TEST_F(Ec, DataThatIsNotHashedIsCutToTheCurve) {
  for (const curve_row& row : CURVES) {
    const bytes blob = imported(row);
    const uint32_t handle = ta.begun(SIGN, blob, use(KM_DIGEST_NONE));
    const bytes message(100, 0xC5);
    EXPECT_EQ(ta.update(handle, byte_view(message).first(20)).b, 20U);
    EXPECT_EQ(ta.update(handle, byte_view(message).subspan(20)).b, row.size() - 20);
    EXPECT_EQ(ta.update(handle, message).b, 0U);
    const bytes made = finished(ta.finish(handle, message));  // whose data is not signed either
    EXPECT_TRUE(row.key.verify({0, 0}, byte_view(message).first(row.size()), made));
  }
}

TEST_F(Ec, NewKeysAreChecked) {
  const bytes data = CURVES[1].key.import_data();
  bytes small = data;
  small[0] = 192;  // of a size field of 256
  small[1] = 0;
  const std::string no_size = "No or too many KM_TAG_KEY_SIZE or specified";
  const auto size = [](uint32_t bits) { return with(ANY_USE, KM_TAG_KEY_SIZE, {bits}); };
  const bad_key rows[] = {
      {ANY_USE, -38, no_size},
      {with(ANY_USE, KM_TAG_KEY_SIZE, {256, 256}), -38, no_size},
      // The size comes first, whatever else is wrong.
      {size(192).add(KM_TAG_ORIGIN, 0), -6, "Invalid EC key size 192"},
      {size(256).add(KM_TAG_ORIGIN, 0), -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {size(256).add(KM_TAG_EC_CURVE, 1), -38, "Shouldn't specify KM_TAG_EC_CURVE"},
      {size(384), -44, "Key size mismatch (given 384, guessed 256)", data},
      {ANY_USE, -6, "Invalid EC key size 192", small},
      {with(ANY_USE, KM_TAG_CREATION_DATETIME, {1}), -38,
       "Shouldn't specify KM_TAG_CREATION_DATETIME", data},
      {with(ANY_USE, KM_TAG_EC_CURVE, {1}), -38, "Shouldn't specify KM_TAG_EC_CURVE", data},
  };
  ta.expect_refused_keys("ec", rows);
}

TEST_F(Ec, KeysAreDescribedAndExported) {
  for (const curve_row& row : CURVES) {
    const bytes generated = ta.generate(with(ANY_USE, KM_TAG_KEY_SIZE, {row.bits}));
    bytes trailing = row.key.import_data();
    trailing.push_back(9);
    const bytes taken = ta.import(ANY_USE, trailing);
    EXPECT_EQ(generated.size(), taken.size()) << "records of one size";
    for (const auto& [blob, origin] :
         {std::pair(generated, KM_ORIGIN_GENERATED), {taken, KM_ORIGIN_IMPORTED}}) {
      const param_set found = ta.characteristics(blob);
      EXPECT_EQ(found.number(KM_TAG_KEY_SIZE), row.bits);
      EXPECT_EQ(found.number(KM_TAG_EC_CURVE), row.km_curve);
      EXPECT_EQ(found.number(KM_TAG_ORIGIN), origin);
      EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
      const reply exported = ta.send_well(key_request(command::EXPORT_KEY, blob));
      const pkey key = pkey::ec_public(exported.output());
      const bytes signature = ta.run(SIGN, blob, use(KM_DIGEST_SHA1), as_bytes("a"));
      EXPECT_TRUE(key.verify({0, KM_DIGEST_SHA1}, as_bytes("a"), signature));
    }
  }
}

TEST_F(Ec, NumbersThatAreNoKeyAreRefusedWhenUsed) {
  const bytes good = CURVES[1].key.import_data();
  client::field_reader in(byte_view(good).subspan(4));
  const bytes x = client::copy_of(in.field());
  const bytes y = client::copy_of(in.field());
  const bytes d = client::copy_of(in.field());
  const bytes order = from_hex("ffffffff00000000ffffffffffffffffbce6faada7179e84f3b9cac2fc632551");
  const bytes too_long(80, 0x11);
  const bytes zero(32);
  const struct {
    bytes x, y, d;
  } rows[] = {{y, x, d},        {x, y, x},        {x, y, zero}, {x, y, order},
              {{}, y, d},       {x, {}, d},       {x, y, {}},   {too_long, y, d},
              {x, too_long, d}, {x, y, too_long}, {zero, y, d}, {zero, zero, d}};
  for (const auto& row : rows) {
    client::field_writer out;
    out.u32(256).field(row.x).field(row.y).field(row.d);
    const bytes blob = ta.import(ANY_USE, out.take());
    ta.expect_refused(begin_request(SIGN, blob, use(KM_DIGEST_SHA1)), -1000,
                      "create_ec_sign: Resolve key data failed");
  }
  const bytes blob = ta.import(ANY_USE, good);
  for (const param_set& params : {param_set(), several(KM_TAG_DIGEST, {4, 4})}) {
    ta.expect_refused(begin_request(VERIFY, blob, params), -38,
                      "create_ec_verify: No or too many KM_TAG_DIGEST");
  }
  ta.expect_refused(begin_request(ENCRYPT, blob, use(4)), -2);
}

}  // namespace
}  // namespace keymaster::test
