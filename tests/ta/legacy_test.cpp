// Keys of the earlier Keymaster: upgrade_key opens their blobs through that TA and seals them anew.
#include <filesystem>
#include <gtest/gtest.h>
#include <stdlib.h>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

constexpr TEEC_UUID EARLIER = EARLIER_KEYMASTER_TA_UUID;
constexpr uint32_t OPEN_BLOB = 27;
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

  // Both sides of the earlier TA: the factory's, and what it says to the normal world.
  TEEC_Result call_earlier(uint32_t command, bytes input, bytes* output) {
    client::connection earlier(client::context(ta.path()), EARLIER);
    client::parameter_slots slots{};
    slots[0].tmpref = {input.data(), input.size()};
    slots[1].tmpref = {output->data(), output->size()};
    const uint32_t types = command == MAKE_BLOB ? TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT,
                                                                   TEEC_MEMREF_TEMP_OUTPUT, 0, 0)
                                                : TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INOUT, 0, 0, 0);
    return earlier.invoke(command, types, &slots).tee;
  }
  bytes legacy_blob(const bytes& content) {
    bytes blob(content.size() + BLOB_OVERHEAD);
    EXPECT_EQ(call_earlier(MAKE_BLOB, content, &blob), TEEC_SUCCESS);
    return blob;
  }
  // Refused with both results, nothing put out.
  void expect_refused(byte_view blob, TEEC_Result res, int32_t km_error, const std::string& line) {
    const reply answer = ta.upgrade(blob);
    EXPECT_EQ(answer.res, res) << line;
    if (res == TEEC_SUCCESS) {
      EXPECT_EQ(answer.km_error, km_error) << line;
    }
    EXPECT_TRUE(ta.trace().has(line)) << line << " is not in: " << ta.trace().errors();
    EXPECT_TRUE(ta.trace().has("upgrade_key: Open V1 key failed")) << ta.trace().errors();
    EXPECT_EQ(answer.buffer, bytes(AMPLE, UNTOUCHED));
    EXPECT_EQ(answer.output_size, AMPLE);
  }
  static bool earlier_is_alive() {
    tee::host::live_counts ignored;
    return tee::host::counts_of(EARLIER_KEYMASTER, &ignored);
  }

  static constexpr TEE_UUID EARLIER_KEYMASTER = EARLIER_KEYMASTER_TA_UUID;
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

  const reply upgraded = ta.upgrade(old);
  ASSERT_TRUE(succeeded(upgraded)) << ta.trace().errors();
  const bytes blob(upgraded.output().begin(), upgraded.output().end());
  const param_set found = ta.characteristics(blob);
  EXPECT_EQ(found.number(KM_TAG_OS_VERSION), OS_VERSION);
  EXPECT_EQ(found.number(KM_TAG_OS_PATCHLEVEL), OS_PATCHLEVEL);
  EXPECT_EQ(without(without(found, KM_TAG_OS_VERSION), KM_TAG_OS_PATCHLEVEL),
            without(set, KM_TAG_OS_VERSION));
  EXPECT_EQ(client::to_hex(ta.run(KM_PURPOSE_SIGN, blob, mac_use(), client::as_bytes("message"))),
            KNOWN_MAC);
}

TEST_F(Legacy, BindingAndVersionHoldForOldKeysToo) {
  const client::application app = {{'i', 'd'}, {'d'}};
  param_set bound = set;
  app.bind(&bound);
  const bytes old = legacy_blob(blob_plaintext(material, bound));
  EXPECT_TRUE(refused(ta.upgrade(old), KM_ERROR_INVALID_KEY_BLOB));
  EXPECT_TRUE(ta.trace().has("upgrade_key: Wrong AppId or AppData"));
  param_set params;
  app.bind(&params);
  EXPECT_TRUE(succeeded(ta.upgrade(old, params)));

  const param_set newer = hmac_key(256).add(KM_TAG_OS_VERSION, OS_VERSION + 1);
  EXPECT_TRUE(
      refused(ta.upgrade(legacy_blob(blob_plaintext(material, newer))), KM_ERROR_INVALID_ARGUMENT));
}

// An unreadable set is -33 here and -38 in a current blob: intended.
TEST_F(Legacy, PlaintextsThatLieAreRefused) {
  const auto fields = [](uint32_t k, byte_view first, uint32_t p, byte_view second) {
    return client::field_writer().u32(k).raw(first).u32(p).raw(second).take();
  };
  const bytes marshalled = set.marshal();
  const auto size = static_cast<uint32_t>(material.size());
  const struct {
    bytes content;
    TEEC_Result res;
    const char* line;
  } rows[] = {
      {{}, TEEC_ERROR_GENERIC, "open_v1_key: Too short input"},
      {fields(0xFFFFFFFF, material, 4, marshalled), TEEC_ERROR_GENERIC,
       "open_v1_key: Too short input"},
      {fields(size, material, static_cast<uint32_t>(marshalled.size()) + 1, marshalled),
       TEEC_ERROR_GENERIC, "open_v1_key: Too short input"},
      {fields(size, material, 0xFFFFFFFF, marshalled), TEEC_ERROR_GENERIC,
       "open_v1_key: Too short input"},
      {fields(size, material, 0, marshalled), TEEC_SUCCESS, "open_v1_key: Unmarshal failed"},
      {fields(size, material, 4, bytes(4, 0xFF)), TEEC_SUCCESS, "open_v1_key: Unmarshal failed"},
  };
  for (const auto& row : rows)
    expect_refused(legacy_blob(row.content), row.res, KM_ERROR_INVALID_KEY_BLOB, row.line);
  for (size_t length = 0; length < plaintext.size(); length++) {
    EXPECT_FALSE(ta.upgrade(legacy_blob({plaintext.begin(), plaintext.begin() + length})).ok())
        << length;
  }
}

TEST_F(Legacy, CutAndChangedBlobsAreRefused) {
  const bytes old = legacy_blob(plaintext);
  for (size_t i = 0; i < old.size(); i++) {
    const bytes cut(old.begin(), old.begin() + i);
    bytes changed = old;
    changed[i] ^= 1;
    EXPECT_TRUE(failed_with(ta.upgrade(cut),
                            i < BLOB_OVERHEAD ? TEEC_ERROR_BAD_FORMAT : TEE_ERROR_MAC_INVALID))
        << i;
    EXPECT_TRUE(
        failed_with(ta.upgrade(changed), i < 4 ? TEEC_ERROR_BAD_FORMAT : TEE_ERROR_MAC_INVALID))
        << i;
  }
}

TEST_F(Legacy, EveryFailedPlatformCallIsReported) {
  const bytes old = legacy_blob(plaintext);
  bool fired = true;
  for (uint64_t n = 1; fired; n++) {
    tee::host::fail_nth_call(n, TEE_ERROR_OUT_OF_MEMORY);
    const reply answer = ta.upgrade(old);
    fired = tee::host::fault_fired();
    tee::host::clear_fault();
    EXPECT_EQ(answer.ok(), !fired) << n;
    EXPECT_EQ(answer.buffer == bytes(AMPLE, UNTOUCHED), fired) << n;
    EXPECT_TRUE(succeeded(ta.upgrade(old))) << n;
  }
}

TEST_F(Legacy, TheEarlierKeymasterIsAskedForUnknownBlobsAlone) {
  bytes blob = ta.generate(hmac_key(256));
  EXPECT_TRUE(succeeded(ta.upgrade(blob)));
  EXPECT_FALSE(earlier_is_alive());
  blob.back() ^= 1;
  expect_refused(blob, TEEC_ERROR_ITEM_NOT_FOUND, 0,  // it never made a blob on this device
                 "open_v1_key: InvokeTACommand failed with 0xffff0008");
  EXPECT_TRUE(earlier_is_alive());
  legacy_blob(plaintext);
  expect_refused(blob, TEEC_ERROR_BAD_FORMAT, 0,
                 "open_v1_key: InvokeTACommand failed with 0xffff0005");
}

TEST_F(Legacy, PlaintextsGoToTheKeymasterAlone) {
  bytes none;
  EXPECT_EQ(call_earlier(OPEN_BLOB, legacy_blob(plaintext), &none), TEEC_ERROR_ACCESS_DENIED);
}

// Devices whose trusted applications lie elsewhere.
class LegacyElsewhere : public Legacy {
 protected:
  // A new instance, with trusted applications from these folders.
  void restart_with(const std::string& folders) {
    setenv("TEE_TA_PATH", folders.c_str(), 1);
    ta.restart();
  }
  ~LegacyElsewhere() override { unsetenv("TEE_TA_PATH"); }

  const std::filesystem::path keymaster_file = KEYMASTER_TA_FILE;
};

TEST_F(LegacyElsewhere, WithoutTheEarlierKeymasterItsSessionFails) {
  const std::filesystem::path folder = ta.path() + "/ta";
  std::filesystem::create_directory(folder);
  std::filesystem::create_symlink(keymaster_file, folder / keymaster_file.filename());
  restart_with(folder);
  expect_refused(bytes(200, 1), TEEC_ERROR_ITEM_NOT_FOUND, 0,
                 "open_v1_key: OpenTASession failed with 0xffff0008");
}

TEST_F(LegacyElsewhere, AnswersThatMisbehaveAreRefused) {
  restart_with(TEST_TA_PATH);
  const struct {
    uint32_t code;
    TEEC_Result res;
    const char* line;
  } rows[] = {
      {TEE_SUCCESS, TEEC_ERROR_GENERIC, "open_v1_key: Too long answer"},
      {TEE_ERROR_SHORT_BUFFER, TEEC_ERROR_SHORT_BUFFER,
       "open_v1_key: InvokeTACommand failed with 0xffff0010"},
      {0x12345678, 0x12345678, "open_v1_key: InvokeTACommand failed with 0x12345678"},
  };
  for (const auto& row : rows) {
    expect_refused(client::field_writer().u32(row.code).raw(bytes(96, 0)).take(), row.res, 0,
                   row.line);
  }
}

}  // namespace
}  // namespace keymaster::test
