// Key blobs and the keys that they are sealed under: stored bytes, blobs that are taken apart and
// made apart from the TA, damage, and what happens to the key in the replay-protected storage.
#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"
#include "tee/core/stored_object.h"
#include "tee/device/object_store.h"

namespace keymaster::test {
namespace {

using client::from_hex;

constexpr TEEC_Result KSK_DELETED = 0xF0100001;

// The device must be stopped.
void store_ksk(const ta_under_test& ta, byte_view ksk) {
  tee::stored_object object;
  object.data.assign(ksk.begin(), ksk.end());
  tee::device::open(ta.path())->objects().save(KSK_OBJECT, tee::encode(object));
}

const bytes FIXED_KSK =
    from_hex("000102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e1f");

reply open(ta_under_test* ta, byte_view blob) {
  return ta->send(key_request(command::GET_KEY_CHARACTER, blob));
}

// Blobs here hold the HMAC key of RFC 4231, test case 1.
bytes make(ta_under_test* ta) {
  return ta->import(hmac_key(), bytes(20, 0x0b));
}

void expect_signs(ta_under_test* ta, byte_view blob) {
  EXPECT_EQ(client::to_hex(ta->run(SIGN, blob, mac_use(), client::as_bytes("Hi There"))),
            "b0344c61d8db38535ca8afceaf0bf12b881dc200c9833da726e9376c2e32cff7");
}

constexpr char FROZEN_DERIVED[] =
    "00ae6ff5bc595bdcfe677cf5c10058c6290b56c89d60650d47ff18fd7024da8f85fd6a5580c21ff93f738b62aee2"
    "d47276f76ed36bd72da7ef5626cb3c30b223524297be907e39dc45728ba2fa4b7814b8d78a66273ea24315979166"
    "4efc8263263500f0a5fb119f977eddbc8b6a43a4e55d3e83050a86b64c4c24ab2dbe012776fa62bbeb08b981e663"
    "e4ee5cdc9184b6499b0c7d294441bab4f18237edc61abe3cf91911bde9bf7656be5e4ff9672fbbf051026b9521da"
    "fc8ebf72740b03a6e528273198b3127a1efb7ee723efe65880e6e9ee82ae5bc86cef65b76600fdcab05ecafd43a0"
    "97773398544493b67e0cf87b7616710da801475f48a4257e3ad2b48287cd4c1eeb38cfad79563f9b95b77da3b9e5"
    "8089a82454d380bbed48b6a04915dcd4306f6a3ba5cb3abeec474a9c7336676d265042a9a728f69c8a56749113d9"
    "4cfe3a99e699557a7e3e27a1946261259705ce4f38023c52709a81517ae2b92ec505c5b160752b1556d9e69c4042"
    "42711b6b180c16981d4c96d93aa57f8f39d1693a24d9005e4b2a71eb54";
constexpr char FROZEN_RPMB[] =
    "01e18601312e73d5259fcc5e14cba4560406879c05583c8f140cd84b4ab2482da78c4c410690f65f0a8925783ad4"
    "923ac86715fa18af8fc9c542d01322c7408e376624238c43dd36080785da08996211cd7414e2844f629c954d42ba"
    "c694aeff006ebddba6eafd70784049bc76ba0a4cb1d433a2608ebdbfc2b23206f40f331fd03ff2c3c3ad1106e6f5"
    "59ddc93b274afcc6eeb55db0c614fe1970d62088aa81c517ad91c08c378ed7eaa25fcbf4f565d7804677d3c922a7"
    "0b4e99d5b22cc932eae27bc63bc768264211103bac3eea65118eff0c3c5f6b3b05323df6978f63762352d729f53e"
    "bbd33e22903181daf85300bb82c2297cb6140e8577b6f36b254615af5a29de397b8835b2cea113754b18a3765fb5"
    "004c166baad8293acf5999c767b70d755a5580dfa505f396f7d7033b50c0c36eda35afcce60bf7e3a3009523745e"
    "b3be30d59e1952fde361f1fb257b9996bb2880a34e7abd404b1b3fcfe45266ac4cde23305c9012763311b1283a2b"
    "8046d6dda16b0074a6b559447d77e2ae956422ec8290f7aab1a471c35c";

TEST(Blob, FrozenOnesOpenForEver) {
  ta_under_test ta;
  ta.stop();
  store_ksk(ta, FIXED_KSK);
  ta.restart();
  for (const char* frozen : {FROZEN_DERIVED, FROZEN_RPMB}) {
    expect_signs(&ta, from_hex(frozen));
    EXPECT_EQ(ta.characteristics(from_hex(frozen)),
              hmac_key()
                  .add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED)
                  .add(KM_TAG_OS_VERSION, 80100)
                  .add(KM_TAG_OS_PATCHLEVEL, 201812)
                  .add(KM_TAG_CREATION_DATETIME, 1'700'000'000'000)
                  .add(KM_TAG_KEY_SIZE, 160));
  }
  const bytes first = make(&ta);
  const bytes second = make(&ta);
  EXPECT_EQ(unseal(first, FIXED_KSK), unseal(second, FIXED_KSK));
  // Salt, nonce and tag are all new.
  for (const auto& [from, to] : {std::pair{1, 65}, {65, 77}, {77, 93}}) {
    EXPECT_NE(bytes(first.begin() + from, first.begin() + to),
              bytes(second.begin() + from, second.begin() + to));
  }
  expect_signs(&ta, seal(unseal(first, FIXED_KSK), FIXED_KSK, 1));
}

// Whatever is wrong with a blob, its opening is answered alike; the reason is traced.
TEST(Blob, ThatDoNotOpenAskForAnUpgrade) {
  ta_under_test ta({.rpmb = false});
  const bytes good = unseal(make(&ta));  // the key's length at 0, its set's length at 32
  const auto changed = [&](size_t offset, int value) {
    bytes plaintext = good;
    plaintext.at(offset) = static_cast<uint8_t>(value);
    return seal(plaintext);
  };
  bytes trailing = good;
  trailing.push_back(0x99);
  const std::string too_short = "open_key: Too short input";
  const std::string no_set = "unmarshal: Too short input | open_key: Unmarshal failed";
  // What is wrong, and the reason; without one the blob opens.
  const std::tuple<const char*, bytes, std::string> cases[] = {
      {"good", seal(good), ""},
      {"bytes behind the characteristics", seal(trailing), ""},
      {"nothing inside", seal({}), "open_key: Too short key blob"},
      {"one byte inside", seal(bytes(1)), too_short},
      {"an empty key and nothing else", seal(bytes(4)), too_short},
      {"key length", changed(1, 0xFF), too_short},
      {"characteristics length", changed(32, good[32] + 1), too_short},
      {"characteristics length of 4 GiB", changed(35, 0xFF), too_short},
      {"characteristics", changed(36, good[36] + 1), no_set},
      {"no characteristics", seal(bytes(8)), no_set},
      {"protection 2", seal(good, derived_ksk(), 2), "open_key: Unknown key protection"},
      {"protection 255", seal(good, derived_ksk(), 255), "open_key: Unknown key protection"},
      {"protection 1", seal(good, derived_ksk(), 1), "open_key: RPMB KSK died, fail to open key"},
      {"another key", seal(good, FIXED_KSK), "open_key: AEDecryptFinal failed with 0xffff3071"},
  };
  for (const auto& [what, blob, reason] : cases) {
    EXPECT_TRUE(refused(open(&ta, blob), reason.empty() ? 0 : -62)) << what;
    const std::string end = reason.empty() ? "" : " | get_key_character: Open key failed";
    EXPECT_EQ(ta.trace().errors(), reason + end) << what;
  }
}

TEST(Blob, NoBitMayChange) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  for (size_t bit = 0; bit < 8 * blob.size(); bit++) {
    bytes changed = blob;
    changed[bit / 8] = static_cast<uint8_t>(changed[bit / 8] ^ 1 << bit % 8);
    EXPECT_TRUE(refused(open(&ta, changed), -62)) << bit;
  }
  EXPECT_TRUE(succeeded(open(&ta, blob)));
}

// What the derived key sealed opens on a device of that identity that has replay-protected storage,
// too; not the other way round.
TEST(KeyStorageKey, BlobsOfTheDerivedOneOpenBesideTheOther) {
  bytes blobs[2];
  for (const bool rpmb : {false, true, false}) {
    ta_under_test ta({.rpmb = rpmb, .configured = false});
    EXPECT_EQ(ta.trace().has("key_store_init: no RPMB for ksk"), !rpmb);
    EXPECT_EQ(ta.trace().errors(),
              rpmb ? "" : "judge_rpmb: TEE_RPMB_MakeFileSystem return 0xffff000a");
    ta.configure(OS_VERSION, OS_PATCHLEVEL);
    if (blobs[rpmb].empty()) blobs[rpmb] = make(&ta);
    EXPECT_EQ(blobs[rpmb][0], rpmb ? 1 : 0);
    EXPECT_TRUE(refused(open(&ta, blobs[0]), 0));
    if (blobs[1].empty()) continue;
    EXPECT_TRUE(refused(open(&ta, blobs[1]), rpmb ? 0 : -62));
  }
}

// A stored key of the wrong length costs one start, which is refused, and every blob made under it.
TEST(KeyStorageKey, OfWrongLengthIsReplacedOverTwoStarts) {
  ta_under_test ta;
  for (const size_t size : {0u, 1u, 31u, 33u, 64u}) {
    const bytes lost = make(&ta);
    ta.stop();
    store_ksk(ta, bytes(size, 7));
    EXPECT_EQ(ta.start(), KSK_DELETED) << size;
    EXPECT_TRUE(
        ta.trace().has("key_store_init_rpmb_ksk: Wrong persistent data length, expected 32B, got " +
                       std::to_string(size) + "B"));
    EXPECT_TRUE(
        ta.trace().has("key_store_init_rpmb_ksk: Now, delete the key and recreate it, but "
                       "all previous keymaster key will die"));
    EXPECT_TRUE(ta.trace().has("TA_CreateEntryPoint: Init key store failed"));
    EXPECT_FALSE(tee::device::open(ta.path())->objects().load(KSK_OBJECT)) << size;
    ta.restart();
    EXPECT_TRUE(refused(open(&ta, lost), -62));
    const bytes kept = make(&ta);
    ta.restart();
    expect_signs(&ta, kept);
  }
}

}  // namespace
}  // namespace keymaster::test
