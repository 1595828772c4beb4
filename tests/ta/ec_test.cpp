// EC keys and ECDSA through the command interface: published signatures, every curve and digest
// against libcrypto, and what is refused.
#include "support/sets.h"
#include "support/ta_under_test.h"
#include "ta/pkey.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using client::from_hex;

constexpr uint32_t UNKNOWN_DIGEST = 7;

// RFC 6979, A.2.4 to A.2.7: key pair, and the signature (r and s of `digest`) of "sample".
struct curve_row {
  uint32_t bits;
  uint32_t km_curve;
  const char *d, *x, *y;
  uint32_t digest;
  const char *r, *s;

  // The raw form.
  bytes data() const {
    client::field_writer out;
    return out.u32(bits).field(from_hex(x)).field(from_hex(y)).field(from_hex(d)).take();
  }
  size_t size() const { return (bits + 7) / 8; }
};

const curve_row CURVES[] = {
    {224, KM_EC_CURVE_P_224, "F220266E1105BFE3083E03EC7A3A654651F45E37167E88600BF257C1",
     "00CF08DA5AD719E42707FA431292DEA11244D64FC51610D94B130D6C",
     "EEAB6F3DEBE455E3DBF85416F7030CBD94F34F2D6F232C69F3C1385A", KM_DIGEST_SHA_2_512,
     "074BD1D979D5F32BF958DDC61E4FB4872ADCAFEB2256497CDAC30397",
     "A4CECA196C3D5A1FF31027B33185DC8EE43F288B21AB342E5D8EB084"},
    {256, KM_EC_CURVE_P_256, "C9AFA9D845BA75166B5C215767B1D6934E50C3DB36E89B127B8A622B120F6721",
     "60FED4BA255A9D31C961EB74C6356D68C049B8923B61FA6CE669622E60F29FB6",
     "7903FE1008B8BC99A41AE9E95628BC64F2F1B20C2D7E9F5177A3C294D4462299", KM_DIGEST_SHA_2_256,
     "EFD48B2AACB6A8FD1140DD9CD45E81D69D2C877B56AAF991C34D0EA84EAF3716",
     "F7CB1C942D657C41D436C7A1B6E29F65F3E900DBB9AFF4064DC4AB2F843ACDA8"},
    {384, KM_EC_CURVE_P_384,
     "6B9D3DAD2E1B8C1C05B19875B6659F4DE23C3B667BF297BA"
     "9AA47740787137D896D5724E4C70A825F872C9EA60D2EDF5",
     "EC3A4E415B4E19A4568618029F427FA5DA9A8BC4AE92E02E"
     "06AAE5286B300C64DEF8F0EA9055866064A254515480BC13",
     "8015D9B72D7D57244EA8EF9AC0C621896708A59367F9DFB9"
     "F54CA84B3F1C9DB1288B231C3AE0D4FE7344FD2533264720",
     KM_DIGEST_SHA_2_384,
     "94EDBB92A5ECB8AAD4736E56C691916B3F88140666CE9FA7"
     "3D64C4EA95AD133C81A648152E44ACF96E36DD1E80FABE46",
     "99EF4AEB15F178CEA1FE40DB2603138F130E740A19624526"
     "203B6351D0A3A94FA329C145786E679E7B82C71A38628AC8"},
    {521, KM_EC_CURVE_P_521,
     "00FAD06DAA62BA3B25D2FB40133DA757205DE67F5BB0018FEE8C86E1B68C7E75CA"
     "A896EB32F1F47C70855836A6D16FCC1466F6D8FBEC67DB89EC0C08B0E996B83538",
     "01894550D0785932E00EAA23B694F213F8C3121F86DC97A04E5A7167DB4E5BCD37"
     "1123D46E45DB6B5D5370A7F20FB633155D38FFA16D2BD761DCAC474B9A2F5023A4",
     "00493101C962CD4D2FDDF782285E64584139C2F91B47F87FF82354D6630F746A28"
     "A0DB25741B5B34A828008B22ACC23F924FAAFBD4D33F81EA66956DFEAA2BFDFCF5",
     KM_DIGEST_SHA_2_512,
     "00C328FAFCBD79DD77850370C46325D987CB525569FB63C5D3BC53950E6D4C5F17"
     "4E25A1EE9017B5D450606ADD152B534931D7D4E8455CC91F9B15BF05EC36E377FA",
     "00617CCE7CF5064806C467F678D3B4080D6F1CC50AF26CA209417308281B68AF28"
     "2623EAA63E5B5C0723D8B8C37FF0777B1A20F8CCB1DCCC43997F1EE0E44DA4A67A"},
};

param_set any_use() {
  param_set key = one(KM_TAG_ALGORITHM, KM_ALGORITHM_EC)
                      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
                      .add_flag(KM_TAG_NO_AUTH_REQUIRED);
  for (uint32_t digest = KM_DIGEST_NONE; digest <= UNKNOWN_DIGEST; digest++)
    key.add(KM_TAG_DIGEST, digest);
  return key;
}

param_set new_key(uint64_t bits) {
  return any_use().add(KM_TAG_KEY_SIZE, bits);
}

param_set use(uint32_t digest) {
  return one(KM_TAG_DIGEST, digest);
}

// r and s as an INTEGER each, in DER.
bytes der(byte_view r, byte_view s) {
  bytes content;
  for (byte_view number : {r, s}) {
    while (number.front() == 0)
      number = number.subspan(1);
    const bool high = number.front() >= 0x80;
    content.push_back(2);
    content.push_back(static_cast<uint8_t>(number.size() + (high ? 1 : 0)));
    if (high) content.push_back(0);
    content.insert(content.end(), number.begin(), number.end());
  }
  bytes head = {0x30};
  if (content.size() > 127) head.push_back(0x81);
  head.push_back(static_cast<uint8_t>(content.size()));
  content.insert(content.begin(), head.begin(), head.end());
  return content;
}

class Ec : public testing::Test {
 protected:
  reply verify(byte_view blob, uint32_t digest, byte_view message, byte_view signature) {
    const uint32_t handle = ta.begun(KM_PURPOSE_VERIFY, blob, use(digest));
    EXPECT_TRUE(succeeded(ta.update(handle, message))) << ta.trace().errors();
    return ta.finish(handle, signature);
  }

  ta_under_test ta;
};

TEST_F(Ec, PublishedSignaturesVerify) {
  for (const curve_row& row : CURVES) {
    const bytes blob = ta.import(any_use(), row.data());
    const bytes signature = der(from_hex(row.r), from_hex(row.s));
    EXPECT_TRUE(succeeded(verify(blob, row.digest, as_bytes("sample"), signature))) << row.bits;
    EXPECT_TRUE(refused(verify(blob, row.digest, as_bytes("simple"), signature), -30));
    for (size_t bit = 0; bit < signature.size() * 8; bit += 5) {
      bytes other = signature;
      other[bit / 8] = static_cast<uint8_t>(other[bit / 8] ^ 1 << bit % 8);
      EXPECT_TRUE(refused(verify(blob, row.digest, as_bytes("sample"), other), -30)) << bit;
    }
    for (size_t size : {size_t{0}, size_t{1}, signature.size() - 1, signature.size() + 1}) {
      bytes other = signature;
      other.resize(size);
      EXPECT_TRUE(refused(verify(blob, row.digest, as_bytes("sample"), other), -30)) << size;
    }
  }
}

TEST_F(Ec, SignaturesAreThoseOfTheStandards) {
  for (const curve_row& row : CURVES) {
    const pkey key = pkey::ec(row.data());
    const bytes blob = ta.import(any_use(), row.data());
    for (uint32_t digest = KM_DIGEST_NONE; digest <= UNKNOWN_DIGEST; digest++) {
      SCOPED_TRACE(std::to_string(row.bits) + " bits, digest " + std::to_string(digest));
      if (digest == KM_DIGEST_MD5 || digest == UNKNOWN_DIGEST) {
        const int32_t error = digest == KM_DIGEST_MD5 ? -13 : -12;
        EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, use(digest)), error));
        EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_VERIFY, blob, use(digest)), error));
        continue;
      }
      // What is not hashed may be shorter than the curve, and is no longer than it.
      const bytes message(digest == KM_DIGEST_NONE ? row.size() : 200, 0xA7);
      for (int i = 0; i < 4; i++) {
        const bytes made = ta.run(KM_PURPOSE_SIGN, blob, use(digest), message);
        EXPECT_TRUE(key.verify({0, digest}, message, made));
        const bytes foreign = key.sign({0, digest}, message);
        EXPECT_TRUE(succeeded(verify(blob, digest, message, foreign)));
      }
      const byte_view part = byte_view(message).first(11);
      EXPECT_TRUE(key.verify({0, digest}, part, ta.run(KM_PURPOSE_SIGN, blob, use(digest), part)));
    }
  }
}

TEST_F(Ec, DataThatIsNotHashedIsCutToTheCurve) {
  for (const curve_row& row : CURVES) {
    const pkey key = pkey::ec(row.data());
    const bytes blob = ta.import(any_use(), row.data());
    const uint32_t handle = ta.begun(KM_PURPOSE_SIGN, blob, use(KM_DIGEST_NONE));
    const bytes message(100, 0xC5);
    EXPECT_EQ(ta.update(handle, byte_view(message).first(20)).b, 20U);
    EXPECT_EQ(ta.update(handle, byte_view(message).subspan(20)).b, row.size() - 20);
    EXPECT_EQ(ta.update(handle, message).b, 0U);
    const reply last = ta.finish(handle, message);  // whose data is not signed either
    ASSERT_TRUE(succeeded(last));
    client::finish_result result;
    client::parse_finished(last.output(), &result);
    EXPECT_TRUE(key.verify({0, 0}, byte_view(message).first(row.size()), result.output));
  }
}

TEST_F(Ec, NewKeysAreChecked) {
  const bytes data = CURVES[1].data();
  bytes small = data;
  small[0] = 192;  // of a size field of 256
  small[1] = 0;
  const struct {
    param_set description;
    const bytes* data;  // null: generate
    int32_t error;
    std::string message;
  } rows[] = {
      {any_use(), nullptr, -38, "No or too many KM_TAG_KEY_SIZE or specified"},
      {new_key(256).add(KM_TAG_KEY_SIZE, 256), nullptr, -38,
       "No or too many KM_TAG_KEY_SIZE or specified"},
      // The size comes first, whatever else is wrong.
      {new_key(192).add(KM_TAG_ORIGIN, 0), nullptr, -6, "Invalid EC key size 192"},
      {new_key(256).add(KM_TAG_ORIGIN, 0), nullptr, -38, "Shouldn't specify KM_TAG_ORIGIN"},
      {new_key(256).add(KM_TAG_EC_CURVE, 1), nullptr, -38, "Shouldn't specify KM_TAG_EC_CURVE"},
      {new_key(384), &data, -44, "Key size mismatch (given 384, guessed 256)"},
      {any_use(), &small, -6, "Invalid EC key size 192"},
      {any_use().add(KM_TAG_CREATION_DATETIME, 1), &data, -38,
       "Shouldn't specify KM_TAG_CREATION_DATETIME"},
      {any_use().add(KM_TAG_EC_CURVE, 1), &data, -38, "Shouldn't specify KM_TAG_EC_CURVE"},
  };
  for (const auto& row : rows) {
    const reply answer = ta.send(row.data == nullptr ? generate_request(row.description)
                                                     : import_request(row.description, *row.data));
    EXPECT_TRUE(refused(answer, row.error)) << row.message;
    const std::string function = row.data == nullptr ? "ec_generate_key: " : "ec_import_key: ";
    EXPECT_TRUE(ta.trace().has(function + row.message)) << ta.trace().errors();
  }
  for (size_t size = 0; size < data.size(); size++) {
    const request cut = import_request(any_use(), byte_view(data).first(size));
    EXPECT_TRUE(failed_with(ta.send(cut), TEEC_ERROR_GENERIC)) << size;
  }
}

TEST_F(Ec, KeysAreDescribedAndExported) {
  for (const curve_row& row : CURVES) {
    const bytes generated = ta.generate(new_key(row.bits));
    bytes trailing = row.data();
    trailing.push_back(9);
    const bytes taken = ta.import(any_use(), trailing);
    EXPECT_EQ(generated.size(), taken.size()) << "records of one size";
    for (const auto& [blob, origin] :
         {std::pair(generated, KM_ORIGIN_GENERATED), {taken, KM_ORIGIN_IMPORTED}}) {
      const param_set found = ta.characteristics(blob);
      EXPECT_EQ(found.number(KM_TAG_KEY_SIZE), row.bits);
      EXPECT_EQ(found.number(KM_TAG_EC_CURVE), row.km_curve);
      EXPECT_EQ(found.number(KM_TAG_ORIGIN), origin);
      EXPECT_EQ(found.number(KM_TAG_CREATION_DATETIME), START_REE_MS / 1000 * 1000);
      const reply exported = ta.send(key_request(command::EXPORT_KEY, blob));
      ASSERT_TRUE(succeeded(exported));
      const pkey key = pkey::ec(exported.output());
      const bytes signature = ta.run(KM_PURPOSE_SIGN, blob, use(KM_DIGEST_SHA1), as_bytes("a"));
      EXPECT_TRUE(key.verify({0, KM_DIGEST_SHA1}, as_bytes("a"), signature));
      for (size_t room = 0; room < exported.output().size(); room++) {
        EXPECT_TRUE(failed_with(ta.send(key_request(command::EXPORT_KEY, blob, {}, room)),
                                TEEC_ERROR_GENERIC));
        EXPECT_TRUE(ta.trace().has("ec_export_key: Too short buffer"));
      }
    }
  }
}

TEST_F(Ec, NumbersThatAreNoKeyAreRefusedWhenUsed) {
  const bytes x = from_hex(CURVES[1].x);
  const bytes y = from_hex(CURVES[1].y);
  const bytes d = from_hex(CURVES[1].d);
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
    const bytes blob = ta.import(any_use(), out.take());
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, use(KM_DIGEST_SHA1)), -1000));
    EXPECT_TRUE(ta.trace().has("create_ec_sign: Resolve key data failed"));
  }
  const bytes blob = ta.import(any_use(), CURVES[1].data());
  for (const param_set& params : {param_set(), use(4).add(KM_TAG_DIGEST, 4)}) {
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_VERIFY, blob, params), -38));
    EXPECT_TRUE(ta.trace().has("create_ec_verify: No or too many KM_TAG_DIGEST"));
  }
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_ENCRYPT, blob, use(4)), -2));
}

TEST_F(Ec, FailuresOfThePlatformAreReportedAndLeaveNothing) {
  const pkey key = pkey::ec(CURVES[3].data());
  ta.watch_secret(from_hex(CURVES[3].d));
  const struct {
    uint32_t purpose;
    uint32_t digest;
    bytes last;
  } rows[] = {{KM_PURPOSE_SIGN, KM_DIGEST_NONE, {}},
              {KM_PURPOSE_SIGN, KM_DIGEST_SHA1, {}},
              {KM_PURPOSE_VERIFY, KM_DIGEST_SHA1, key.sign({0, KM_DIGEST_SHA1}, as_bytes("a"))}};
  for (const auto& row : rows) {
    SCOPED_TRACE(row.purpose);
    expect_faults_reported([&] {
      return live_through(&ta, any_use(), CURVES[3].data(), row.purpose, use(row.digest),
                          as_bytes("a"), row.last);
    });
  }
  expect_faults_reported([&] { return ta.send(generate_request(new_key(224))).ok(); });
}

}  // namespace
}  // namespace keymaster::test
