// Keys of the earlier Keymaster: upgrade_key opens their blobs through that TA and seals them anew.
#include <filesystem>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_folders.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

constexpr uint32_t MAKE_BLOB = 100;
constexpr size_t BLOB_OVERHEAD = 32;

// HMAC-SHA256 of "message" under the bytes 00 to 1f.
constexpr char KNOWN_MAC[] = "6297b77508a1a30ea4dfadd8f847c31b49aba45de10a79daf721d3f7ec112a24";

class Legacy : public testing::Test {
 protected:
  Legacy() {
    for (uint8_t i = 0; i < 32; i++)
      key.push_back(i);
    material = hmac_material(key);
    plaintext = blob_plaintext(material, set);
  }

  ~Legacy() override { use_own_tas(); }

  // A new instance, with trusted applications from these folders.
  void restart_with(const std::string& folders) {
    use_ta_folders(folders);
    ta.restart();
  }
  // A blob as the factory made them with the earlier TA.
  bytes legacy_blob(bytes content) {
    client::connection earlier(client::context(ta.path()), EARLIER_KEYMASTER_TA_UUID);
    bytes blob(content.size() + BLOB_OVERHEAD);
    client::parameter_slots slots{};
    slots[0].tmpref = {content.data(), content.size()};
    slots[1].tmpref = {blob.data(), blob.size()};
    const uint32_t types = TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, 0, 0);
    EXPECT_TRUE(earlier.invoke(MAKE_BLOB, types, &slots).ok());
    return blob;
  }
  // Refused with both results, nothing put out.
  void expect_refused(byte_view blob, TEEC_Result res, const std::string& line) {
    const reply answer = ta.upgrade(blob);
    EXPECT_EQ(answer.res, res) << line;
    EXPECT_TRUE(res != TEEC_SUCCESS || answer.km_error == KM_ERROR_INVALID_KEY_BLOB) << line;
    EXPECT_TRUE(ta.trace().has(line)) << line << " is not in: " << ta.trace().errors();
    EXPECT_TRUE(ta.trace().has("upgrade_key: Open V1 key failed")) << ta.trace().errors();
    EXPECT_EQ(answer.buffer, bytes(AMPLE, UNTOUCHED));
    EXPECT_EQ(answer.output_size, AMPLE);
  }
  static bool earlier_is_alive() {
    tee::host::live_counts ignored;
    return tee::host::counts_of(EARLIER_KEYMASTER_TA_UUID, &ignored);
  }

  bytes key, material, plaintext;
  const param_set set =
      hmac_key(256).add(KM_TAG_OS_VERSION, 70000).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  ta_under_test ta;
};

TEST_F(Legacy, BlobsAreUpgradedAndOpenAsCurrentOnes) {
  ta.watch_secret(key);
  plaintext.push_back(0x77);  // what follows the characteristics is ignored
  const bytes old = legacy_blob(plaintext);
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, old, mac_use()), KM_ERROR_KEY_REQUIRES_UPGRADE));

  const bytes blob = client::copy_of(ta.send_well(upgrade_request(old)).output());
  const param_set found = ta.characteristics(blob);
  EXPECT_EQ(found.number(KM_TAG_OS_VERSION), OS_VERSION);
  EXPECT_EQ(found.number(KM_TAG_OS_PATCHLEVEL), OS_PATCHLEVEL);
  EXPECT_EQ(without(without(found, KM_TAG_OS_VERSION), KM_TAG_OS_PATCHLEVEL),
            without(set, KM_TAG_OS_VERSION));
  EXPECT_EQ(client::to_hex(ta.run(KM_PURPOSE_SIGN, blob, mac_use(), client::as_bytes("message"))),
            KNOWN_MAC);
}

TEST_F(Legacy, BindingAndVersionHoldForOldKeysToo) {
  const param_set app = bound_to("id", "d");
  const bytes old = legacy_blob(blob_plaintext(material, param_set(set).append(app)));
  EXPECT_TRUE(refused(ta.upgrade(old), KM_ERROR_INVALID_KEY_BLOB));
  EXPECT_TRUE(ta.trace().has("upgrade_key: Wrong AppId or AppData"));
  EXPECT_TRUE(succeeded(ta.upgrade(old, app)));

  const param_set newer = hmac_key(256).add(KM_TAG_OS_VERSION, OS_VERSION + 1);
  EXPECT_TRUE(
      refused(ta.upgrade(legacy_blob(blob_plaintext(material, newer))), KM_ERROR_INVALID_ARGUMENT));
}

// An unreadable set is -33 here and -38 in a current blob: intended.
TEST_F(Legacy, PlaintextsThatLieAreRefused) {
  const auto lengths = [&](uint32_t of_key, uint32_t of_set) {
    return client::field_writer().u32(of_key).raw(material).u32(of_set).raw(set.marshal()).take();
  };
  const auto size = static_cast<uint32_t>(material.size());
  const std::string short_input = "open_v1_key: Too short input";
  expect_refused(legacy_blob(lengths(UINT32_MAX, 4)), TEEC_ERROR_GENERIC, short_input);
  expect_refused(legacy_blob(lengths(size, UINT32_MAX)), TEEC_ERROR_GENERIC, short_input);
  expect_refused(legacy_blob(lengths(size, 0)), TEEC_SUCCESS, "open_v1_key: Unmarshal failed");
  for (size_t length = 0; length < plaintext.size(); length++) {
    const bytes cut(plaintext.begin(), plaintext.begin() + length);
    EXPECT_FALSE(ta.upgrade(legacy_blob(cut)).ok()) << length;
  }
}

TEST_F(Legacy, CutAndChangedBlobsAreRefused) {
  const bytes old = legacy_blob(plaintext);
  for (size_t i = 0; i < old.size(); i++) {
    const bytes cut(old.begin(), old.begin() + i);
    bytes changed = old;
    changed[i] ^= 1;
    EXPECT_EQ(ta.upgrade(cut).res,
              i < BLOB_OVERHEAD ? TEEC_ERROR_BAD_FORMAT : TEE_ERROR_MAC_INVALID);
    EXPECT_EQ(ta.upgrade(changed).res, i < 4 ? TEEC_ERROR_BAD_FORMAT : TEE_ERROR_MAC_INVALID) << i;
  }
}

TEST_F(Legacy, EveryFailedPlatformCallIsReported) {
  const bytes old = legacy_blob(plaintext);
  const auto upgrade = [&] { return upgrade_request(old); };
  ta.fail_each_call(TEE_ERROR_OUT_OF_MEMORY, upgrade, [&](const reply& answer, bool fired) {
    EXPECT_EQ(answer.ok(), !fired);
    EXPECT_EQ(answer.buffer == bytes(AMPLE, UNTOUCHED), fired);
    EXPECT_TRUE(succeeded(ta.upgrade(old)));
  });
}

TEST_F(Legacy, TheEarlierKeymasterIsAskedForUnknownBlobsAlone) {
  bytes blob = ta.generate(hmac_key(256));
  EXPECT_TRUE(succeeded(ta.upgrade(blob)));
  EXPECT_FALSE(earlier_is_alive());
  blob.back() ^= 1;
  expect_refused(blob, TEEC_ERROR_ITEM_NOT_FOUND,  // it never made a blob on this device
                 "open_v1_key: InvokeTACommand failed with 0xffff0008");
  EXPECT_TRUE(earlier_is_alive());
  legacy_blob(plaintext);
  expect_refused(blob, TEEC_ERROR_BAD_FORMAT,
                 "open_v1_key: InvokeTACommand failed with 0xffff0005");
}

TEST_F(Legacy, WithoutTheEarlierKeymasterItsSessionFails) {
  const std::filesystem::path folder = ta.path() + "/ta";
  std::filesystem::create_directory(folder);
  std::filesystem::create_symlink(keymaster_file(), folder / keymaster_file().filename());
  restart_with(folder);
  expect_refused(bytes(200, 1), TEEC_ERROR_ITEM_NOT_FOUND,
                 "open_v1_key: OpenTASession failed with 0xffff0008");
}

TEST_F(Legacy, AnswersThatMisbehaveAreRefused) {
  restart_with(TEST_TA_PATH);
  const auto answered_with = [](uint32_t code) {
    return client::field_writer().u32(code).raw(bytes(96, 0)).take();
  };
  expect_refused(answered_with(TEE_SUCCESS), TEEC_ERROR_GENERIC, "open_v1_key: Too long answer");
  expect_refused(answered_with(0x12345678), 0x12345678,
                 "open_v1_key: InvokeTACommand failed with 0x12345678");
}

}  // namespace
}  // namespace keymaster::test
