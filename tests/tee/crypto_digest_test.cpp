// Digests and HMAC against published values, and how their calls treat lengths.
#include "support.h"

namespace tee::test {
namespace {

bytes text(std::string_view characters) {
  return {characters.begin(), characters.end()};
}

using digests = in_instance;
using macs = in_instance;

// RFC 1321, A.5; FIPS 180-4 examples.
TEST_F(digests, published_values_in_one_and_two_parts) {
  const struct {
    uint32_t algorithm;
    const char* digest;
  } rows[] = {
      {TEE_ALG_MD5, "900150983cd24fb0d6963f7d28e17f72"},
      {TEE_ALG_SHA1, "a9993e364706816aba3e25717850c26c9cd0d89d"},
      {TEE_ALG_SHA224, "23097d223405d8228642a477bda255b32aadbce4bda0b3f7e36c9da7"},
      {TEE_ALG_SHA256, "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
      {TEE_ALG_SHA384,
       "cb00753f45a35e8bb5a03d699ac65007272c32ab0eded1631a8b605a43ff5bed8086072ba1e7cc2358baeca134c"
       "8"
       "25a7"},
      {TEE_ALG_SHA512,
       "ddaf35a193617abacc417349ae20413112e6fa4e89a97ea20a9eeee64b55d39a2192992a274fc1a836ba3c23a3f"
       "e"
       "ebbd454d4423643ce80e2a9ac94fa54ca49f"},
  };
  const bytes message = text("abc");
  for (const auto& row : rows) {
    const bytes expected = hex(row.digest);
    TEE_OperationHandle op = operation(row.algorithm, TEE_MODE_DIGEST, 0, nullptr);
    // The second round finds the operation fresh; a query of the length takes nothing in.
    for (int round = 0; round < 2; ++round) {
      TEE_DigestUpdate(op, message.data(), 1);
      size_t length = 0;
      EXPECT_EQ(TEE_DigestDoFinal(op, message.data() + 1, 2, nullptr, &length),
                TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, expected.size());
      bytes digest(length);
      EXPECT_EQ(TEE_DigestDoFinal(op, message.data() + 1, 2, digest.data(), &length), TEE_SUCCESS);
      EXPECT_EQ(digest, expected) << std::hex << row.algorithm;
    }
    TEE_FreeOperation(op);
  }
}

struct mac_row {
  uint32_t type;
  uint32_t algorithm;
  const char* key;
  const char* message;
  const char* mac;
};

// RFC 4231, 4.2 (all digests) and 4.3 to 4.5 (SHA-256); RFC 2202, 3.
constexpr const char* KEY_OF_20 = "0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b0b";
constexpr const char* HI_THERE = "4869205468657265";
const mac_row MACS[] = {
    {TEE_TYPE_HMAC_SHA1, TEE_ALG_HMAC_SHA1, KEY_OF_20, HI_THERE,
     "b617318655057264e28bc0b6fb378c8ef146be00"},
    {TEE_TYPE_HMAC_SHA224, TEE_ALG_HMAC_SHA224, KEY_OF_20, HI_THERE,
     "896fb1128abbdf196832107cd49df33f47b4b1169912ba4f53684b22"},
    {TEE_TYPE_HMAC_SHA256, TEE_ALG_HMAC_SHA256, KEY_OF_20, HI_THERE,
     "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7"},
    {TEE_TYPE_HMAC_SHA384, TEE_ALG_HMAC_SHA384, KEY_OF_20, HI_THERE,
     "afd03944d84895626b0825f4ab46907f15f9dadbe4101ec682aa034c7cebc59cfaea9ea9076ede7f4af152e8b2fa9"
     "c"
     "b6"},
    {TEE_TYPE_HMAC_SHA512, TEE_ALG_HMAC_SHA512, KEY_OF_20, HI_THERE,
     "87aa7cdea5ef619d4ff0b4241a1d6cb02379f4e2ce4ec2787ad0b30545e17cdedaa833b7d6b8a702038b274eaea3f"
     "4"
     "e4be9d914eeb61f1702e696c203a126854"},
    {TEE_TYPE_HMAC_SHA256, TEE_ALG_HMAC_SHA256, "4a656665",
     "7768617420646f2079612077616e7420666f72206e6f7468696e673f",
     "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843"},
    {TEE_TYPE_HMAC_SHA256, TEE_ALG_HMAC_SHA256,
     "0102030405060708090a0b0c0d0e0f10111213141516171819",
     "cdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcdcd"
     "cdcdcdcd",
     "82558a389a443c0ea4cc819899f2083a85f0faa3e578f8077a2e3ff46729665b"},
};

// Each key is populated twice, so that the second operation gets the context of the first one,
// which was left in the middle of a message.
TEST_F(macs, published_values_with_fresh_and_used_keys) {
  for (const mac_row& row : MACS) {
    const bytes key = hex(row.key);
    const bytes message = hex(row.message);
    const bytes expected = hex(row.mac);
    for (int round = 0; round < 2; ++round) {
      TEE_OperationHandle op = operation(row.algorithm, TEE_MODE_MAC, 0, secret_key(row.type, key));
      TEE_MACInit(op, nullptr, 0);
      TEE_MACUpdate(op, message.data(), 3);
      size_t length = 1;
      bytes mac(64);
      EXPECT_EQ(
          TEE_MACComputeFinal(op, message.data() + 3, message.size() - 3, mac.data(), &length),
          TEE_ERROR_SHORT_BUFFER);
      EXPECT_EQ(length, expected.size());
      length = mac.size();
      EXPECT_EQ(
          TEE_MACComputeFinal(op, message.data() + 3, message.size() - 3, mac.data(), &length),
          TEE_SUCCESS);
      mac.resize(length);
      EXPECT_EQ(mac, expected) << std::hex << row.algorithm;
      TEE_MACInit(op, nullptr, 0);
      TEE_MACUpdate(op, message.data(), message.size());
      TEE_FreeOperation(op);
    }
  }
}

// Two operations on one key at the same time must not share a running computation.
TEST_F(macs, operations_on_one_key_are_independent) {
  const bytes key = hex(KEY_OF_20);
  const bytes message = hex(HI_THERE);
  TEE_OperationHandle ops[2];
  for (auto& op : ops) {
    op = operation(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 160, secret_key(TEE_TYPE_HMAC_SHA256, key));
    TEE_MACInit(op, nullptr, 0);
  }
  for (uint8_t byte : message) {
    for (auto op : ops)
      TEE_MACUpdate(op, &byte, 1);
  }
  for (auto op : ops) {
    bytes mac(32);
    size_t length = mac.size();
    EXPECT_EQ(TEE_MACComputeFinal(op, nullptr, 0, mac.data(), &length), TEE_SUCCESS);
    EXPECT_EQ(mac, hex(MACS[2].mac));
    TEE_FreeOperation(op);
  }
}

}  // namespace
}  // namespace tee::test
