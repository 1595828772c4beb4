// ECDSA against published signatures, and what keys and signatures are refused.
#include <algorithm>

#include "support.h"

namespace tee::test {
namespace {

// RFC 6979, A.2.3 to A.2.7: key pair, and the signature of SHA-256 of "sample".
struct curve_row {
  uint32_t curve, bits, algorithm;
  const char *d, *x, *y, *r, *s;
};
const curve_row CURVES[] = {
    {TEE_ECC_CURVE_NIST_P192, 192, TEE_ALG_ECDSA_P192,
     "6FAB034934E4C0FC9AE67F5B5659A9D7D1FEFD187EE09FD4",
     "AC2C77F529F91689FEA0EA5EFEC7F210D8EEA0B9E047ED56",
     "3BC723E57670BD4887EBC732C523063D0A7C957BC97C1C43",
     "4B0B8CE98A92866A2820E20AA6B75B56382E0F9BFD5ECB55",
     "CCDB006926EA9565CBADC840829D8C384E06DE1F1E381B85"},
    {TEE_ECC_CURVE_NIST_P224, 224, TEE_ALG_ECDSA_P224,
     "F220266E1105BFE3083E03EC7A3A654651F45E37167E88600BF257C1",
     "00CF08DA5AD719E42707FA431292DEA11244D64FC51610D94B130D6C",
     "EEAB6F3DEBE455E3DBF85416F7030CBD94F34F2D6F232C69F3C1385A",
     "61AA3DA010E8E8406C656BC477A7A7189895E7E840CDFE8FF42307BA",
     "BC814050DAB5D23770879494F9E0A680DC1AF7161991BDE692B10101"},
    {TEE_ECC_CURVE_NIST_P256, 256, TEE_ALG_ECDSA_P256,
     "C9AFA9D845BA75166B5C215767B1D6934E50C3DB36E89B127B8A622B120F6721",
     "60FED4BA255A9D31C961EB74C6356D68C049B8923B61FA6CE669622E60F29FB6",
     "7903FE1008B8BC99A41AE9E95628BC64F2F1B20C2D7E9F5177A3C294D4462299",
     "EFD48B2AACB6A8FD1140DD9CD45E81D69D2C877B56AAF991C34D0EA84EAF3716",
     "F7CB1C942D657C41D436C7A1B6E29F65F3E900DBB9AFF4064DC4AB2F843ACDA8"},
    {TEE_ECC_CURVE_NIST_P384, 384, TEE_ALG_ECDSA_P384,
     "6B9D3DAD2E1B8C1C05B19875B6659F4DE23C3B667BF297BA9AA47740787137D896D5724E4C70A825F872C9EA60D2E"
     "D"
     "F5",
     "EC3A4E415B4E19A4568618029F427FA5DA9A8BC4AE92E02E06AAE5286B300C64DEF8F0EA9055866064A254515480B"
     "C"
     "13",
     "8015D9B72D7D57244EA8EF9AC0C621896708A59367F9DFB9F54CA84B3F1C9DB1288B231C3AE0D4FE7344FD2533264"
     "7"
     "20",
     "21B13D1E013C7FA1392D03C5F99AF8B30C570C6F98D4EA8E354B63A21D3DAA33BDE1E888E63355D92FA2B3C36D8FB"
     "2"
     "CD",
     "F3AA443FB107745BF4BD77CB3891674632068A10CA67E3D45DB2266FA7D1FEEBEFDC63ECCD1AC42EC0CB8668A4FA0"
     "A"
     "B0"},
    {TEE_ECC_CURVE_NIST_P521, 521, TEE_ALG_ECDSA_P521,
     "00FAD06DAA62BA3B25D2FB40133DA757205DE67F5BB0018FEE8C86E1B68C7E75CAA896EB32F1F47C70855836A6D16"
     "F"
     "CC1466F6D8FBEC67DB89EC0C08B0E996B83538",
     "01894550D0785932E00EAA23B694F213F8C3121F86DC97A04E5A7167DB4E5BCD371123D46E45DB6B5D5370A7F20FB"
     "6"
     "33155D38FFA16D2BD761DCAC474B9A2F5023A4",
     "00493101C962CD4D2FDDF782285E64584139C2F91B47F87FF82354D6630F746A28A0DB25741B5B34A828008B22ACC"
     "2"
     "3F924FAAFBD4D33F81EA66956DFEAA2BFDFCF5",
     "01511BB4D675114FE266FC4372B87682BAECC01D3CC62CF2303C92B3526012659D16876E25C7C1E57648F23B73564"
     "D"
     "67F61C6F14D527D54972810421E7D87589E1A7",
     "004A171143A83163D6DF460AAF61522695F207A58B95C0644D87E52AA1A347916E4F7A72930B1BC06DBE22CE3F582"
     "6"
     "4AFD23704CBB63B29B931F7DE6C9D949A7ECFC"},
};
const bytes SAMPLE = hex("AF2BDBE1AA9B6EC1E2ADE1D694F41FC71A831D0268E9891562113D8A62ADD1BF");

bytes both(const bytes& first, const bytes& second) {
  bytes joined = first;
  joined.insert(joined.end(), second.begin(), second.end());
  return joined;
}

TEE_ObjectHandle ec_key(const curve_row& row, const bytes& d, const bytes& x, const bytes& y,
                        TEE_Result* result, uint32_t curve = 0) {
  return populate(
      TEE_TYPE_ECDSA_KEYPAIR, row.bits,
      {ref(TEE_ATTR_ECC_PUBLIC_VALUE_X, x), ref(TEE_ATTR_ECC_PUBLIC_VALUE_Y, y),
       ref(TEE_ATTR_ECC_PRIVATE_VALUE, d), value(TEE_ATTR_ECC_CURVE, curve ? curve : row.curve)},
      result);
}

TEE_OperationHandle ec_operation(const curve_row& row, uint32_t mode) {
  TEE_Result result = TEE_SUCCESS;
  TEE_ObjectHandle key = ec_key(row, hex(row.d), hex(row.x), hex(row.y), &result);
  EXPECT_EQ(result, TEE_SUCCESS);
  return operation(row.algorithm, mode, row.bits, key);
}

TEE_Result verify(TEE_OperationHandle op, const bytes& digest, const bytes& signature) {
  return TEE_AsymmetricVerifyDigest(op, nullptr, 0, digest.data(), digest.size(), signature.data(),
                                    signature.size());
}

bytes sign(const curve_row& row, const bytes& digest) {
  TEE_OperationHandle op = ec_operation(row, TEE_MODE_SIGN);
  size_t length = 0;
  EXPECT_EQ(
      TEE_AsymmetricSignDigest(op, nullptr, 0, digest.data(), digest.size(), nullptr, &length),
      TEE_ERROR_SHORT_BUFFER);
  bytes signature(length);
  EXPECT_EQ(TEE_AsymmetricSignDigest(op, nullptr, 0, digest.data(), digest.size(), signature.data(),
                                     &length),
            TEE_SUCCESS);
  EXPECT_EQ(length, (row.bits + 7) / 8 * 2);
  TEE_FreeOperation(op);
  return signature;
}

using ecdsa = in_instance;

TEST_F(ecdsa, published_signatures_and_forged_ones) {
  for (const curve_row& row : CURVES) {
    TEE_OperationHandle op = ec_operation(row, TEE_MODE_VERIFY);
    const bytes r = hex(row.r);
    const bytes s = hex(row.s);
    const bytes good = both(r, s);
    EXPECT_EQ(verify(op, SAMPLE, good), TEE_SUCCESS) << row.bits;
    for (size_t changed = 0; changed < good.size(); ++changed) {
      bytes forged = good;
      forged[changed] ^= 0x40;
      EXPECT_EQ(verify(op, SAMPLE, forged), TEE_ERROR_SIGNATURE_INVALID);
    }
    const bytes zero(r.size());
    const bytes most(r.size(), 0xFF);
    const bytes shorter(good.begin(), good.end() - 1);
    for (const bytes& bad : {both(zero, s), both(r, zero), both(most, s), both(r, most), bytes{},
                             shorter, both(good, {0})}) {
      EXPECT_EQ(verify(op, SAMPLE, bad), TEE_ERROR_SIGNATURE_INVALID);
    }
    TEE_FreeOperation(op);
  }
}

// Digests of every length are signed; only the leftmost bits of the curve's size count.
TEST_F(ecdsa, digests_of_any_length) {
  for (const curve_row& row : CURVES) {
    TEE_OperationHandle op = ec_operation(row, TEE_MODE_VERIFY);
    for (size_t length : {0, 1, 20, 24, 28, 32, 48, 64, 65, 66, 67, 100}) {
      bytes digest(length, 0xC3);
      if (length == 66) digest[0] = 1;  // 521 bits: a finished number
      const bytes signature = sign(row, digest);
      EXPECT_EQ(verify(op, digest, signature), TEE_SUCCESS) << row.bits << " " << length;
      if (length == 0) continue;
      digest.back() ^= 0xFF;
      bool counts = length * 8 <= std::max(row.bits, row.bits == 521 ? 528U : 0U);
      EXPECT_EQ(verify(op, digest, signature), counts ? TEE_ERROR_SIGNATURE_INVALID : TEE_SUCCESS)
          << row.bits << " " << length;
    }
    TEE_FreeOperation(op);
  }
}

// P-521: a number in 66 bytes is taken as it is, and the same number as the leftmost 521 bits of a
// longer digest is the same message.
TEST_F(ecdsa, finished_numbers_of_521_bits) {
  const curve_row& row = CURVES[4];
  TEE_OperationHandle op = ec_operation(row, TEE_MODE_VERIFY);
  EXPECT_EQ(verify(op, both(bytes(66 - SAMPLE.size()), SAMPLE), both(hex(row.r), hex(row.s))),
            TEE_SUCCESS);
  bytes digest(67, 0xC3);
  bytes number(66);
  for (size_t i = 0; i < number.size(); ++i) {
    number[i] = static_cast<uint8_t>((i > 0 ? digest[i - 1] << 1 : 0) | digest[i] >> 7);
  }
  EXPECT_EQ(verify(op, digest, sign(row, number)), TEE_SUCCESS);
  TEE_FreeOperation(op);
}

TEST_F(ecdsa, keys_are_checked_when_populated) {
  for (const curve_row& row : CURVES) {
    const bytes d = hex(row.d);
    const bytes x = hex(row.x);
    const bytes y = hex(row.y);
    const bytes long_x = both(bytes(5), x);
    const bytes none(d.size());
    const bytes most(d.size(), 0xFF);
    bytes other = d;
    other.back() ^= 1;
    uint32_t curve_above = row.curve == TEE_ECC_CURVE_NIST_P521 ? 9 : row.curve + 1;
    const struct {
      const bytes &d, &x, &y;
      uint32_t curve;
      TEE_Result result;
    } rows[] = {
        {d, x, y, 0, TEE_SUCCESS},
        {d, long_x, y, 0, TEE_SUCCESS},
        {other, x, y, 0, TEE_ERROR_BAD_PARAMETERS},
        {none, x, y, 0, TEE_ERROR_BAD_PARAMETERS},
        {most, x, y, 0, TEE_ERROR_BAD_PARAMETERS},
        {d, y, x, 0, TEE_ERROR_BAD_PARAMETERS},
        {d, none, none, 0, TEE_ERROR_BAD_PARAMETERS},
        {d, most, y, 0, TEE_ERROR_BAD_PARAMETERS},
        {d, both(most, x), y, 0, TEE_ERROR_BAD_PARAMETERS},
        {d, x, y, curve_above, TEE_ERROR_BAD_PARAMETERS},
    };
    for (const auto& change : rows) {
      TEE_Result result = TEE_SUCCESS;
      TEE_ObjectHandle key = ec_key(row, change.d, change.x, change.y, &result, change.curve);
      EXPECT_EQ(result, change.result) << row.bits;
      TEE_FreeTransientObject(key);
    }
  }
}

// Numbers come out padded to the field; what was generated can be populated and used.
TEST_F(ecdsa, generated_keys_work_again) {
  for (const curve_row& row : CURVES) {
    TEE_ObjectHandle object = nullptr;
    ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_ECDSA_KEYPAIR, row.bits, &object), TEE_SUCCESS);
    TEE_Attribute curve = value(TEE_ATTR_ECC_CURVE, row.curve % 5 + 1);
    EXPECT_EQ(TEE_GenerateKey(object, row.bits, &curve, 1), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(TEE_GenerateKey(object, row.bits, nullptr, 0), TEE_ERROR_BAD_PARAMETERS);
    curve = value(TEE_ATTR_ECC_CURVE, row.curve);
    ASSERT_EQ(TEE_GenerateKey(object, row.bits, &curve, 1), TEE_SUCCESS);
    bytes numbers[3];
    const uint32_t ids[] = {TEE_ATTR_ECC_PRIVATE_VALUE, TEE_ATTR_ECC_PUBLIC_VALUE_X,
                            TEE_ATTR_ECC_PUBLIC_VALUE_Y};
    for (size_t i = 0; i < 3; ++i) {
      numbers[i].resize((row.bits + 7) / 8 + 1);
      size_t length = numbers[i].size();
      TEE_GetObjectBufferAttribute(object, ids[i], numbers[i].data(), &length);
      EXPECT_EQ(length, (row.bits + 7) / 8);
      numbers[i].resize(length);
    }
    TEE_FreeTransientObject(object);
    instance fresh(UUID, shared_device(), HEAP_LIMIT);  // whose key cache is empty
    instance_scope inside(fresh);
    TEE_Result result = TEE_SUCCESS;
    TEE_FreeTransientObject(ec_key(row, numbers[0], numbers[1], numbers[2], &result));
    EXPECT_EQ(result, TEE_SUCCESS);
  }
}

}  // namespace
}  // namespace tee::test
