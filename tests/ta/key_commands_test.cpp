// The commands that make, describe, export, upgrade and delete keys.
#include <algorithm>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

const bytes KEY(32, 0x11);

client::application app(std::string_view id, std::string_view data) {
  return {bytes(id.begin(), id.end()), bytes(data.begin(), data.end())};
}

const param_set BOUND = hmac_key(256).append(bound_to("id", "data"));

TEST(MakeKey, RefusesDescriptions) {
  const param_set none = without(hmac_key(256), KM_TAG_ALGORITHM);
  const param_set twice = hmac_key(256).append(one(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC));
  const param_set unknown = param_set(none).add(KM_TAG_ALGORITHM, 2);
  const param_set usages = hmac_key(256).append(several(KM_TAG_BLOB_USAGE_REQUIREMENTS, {0, 0}));
  const bad_key rows[] = {
      {none, -38, "No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM"},
      {none, -38, "No or too many KM_TAG_ALGORITHM", KEY},
      {twice, -38, "No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM"},
      {twice, -38, "No or too many KM_TAG_ALGORITHM", KEY},
      {unknown, -4, ""},
      {unknown, -4, "Unsupport import_key for algorithm  (2)", KEY},
      {usages, -40, "Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified"},
      {usages, -40, "Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified", KEY},
  };
  ta_under_test ta;
  ta.expect_refused_keys("", rows);
}

TEST(MakeKey, NamesWhatIsWrongWithItsBuffers) {
  const bytes good = import_request(hmac_key(), KEY).input;
  const std::string no_set = "unmarshal: Too short input | ";
  const std::tuple<uint32_t, bytes, size_t, TEEC_Result, std::string> cases[] = {
      {13, {1, 0, 0, 0}, 10, 0xFFFF0006, no_set + "generate_key: Unmarshal failed"},
      {19, {4, 0, 0, 0, 1, 0, 0, 0}, 10, 0xFFFF0006, no_set + "import_key: Unmarshal failed"},
      {19, {4, 0, 0, 0, 1, 0, 0}, 0, 0xFFFF0000, "import_key: Too short input"},
      {19, bytes(8, 0xFF), 0, 0xFFFF0000, "import_key: Too short input"},
      {19, good, 0, 0xFFFF0000, "import_key: Too short buffer"},
      {19, good, 7, 0xFFFF0000, "import_key: Too short buffer"},
      {19, good, 8, 0xFFFF0010,
       "save_key: Too short key blob | import_key: Can't save key to TEE storage"},
  };
  ta_under_test ta;
  for (const auto& [id, input, capacity, res, errors] : cases) {
    const reply answer = ta.send({.id = id, .input = input, .capacity = capacity});
    EXPECT_TRUE(failed_with(answer, res)) << errors;
    EXPECT_EQ(ta.trace().errors(), errors);
  }
}

TEST(MakeKey, CompletesTheCharacteristicsAndHidesTheBinding) {
  const param_set description = param_set(BOUND).add_bytes(KM_TAG_ROOT_OF_TRUST, as_bytes("root"));
  const auto completed = [](const param_set& from, uint32_t origin) {
    return param_set(from)
        .add(KM_TAG_ORIGIN, origin)
        .add(KM_TAG_OS_VERSION, OS_VERSION)
        .add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL)
        .add(KM_TAG_CREATION_DATETIME, START_REE_MS / 1000 * 1000);
  };
  ta_under_test ta({.rpmb = false});
  const bytes blob = ta.generate(description);
  const param_set visible = completed(hmac_key(256), KM_ORIGIN_GENERATED);
  EXPECT_EQ(ta.characteristics(blob, app("id", "data")), visible);
  EXPECT_EQ(ta.send(key_request(command::GET_KEY_CHARACTER_SIZE, blob, app("id", "data"))).b,
            visible.marshal().size());
  const bytes plaintext = unseal(blob);
  client::field_reader sealed(plaintext);
  EXPECT_EQ(sealed.field().size(), 40u);
  EXPECT_EQ(param_set::parse(sealed.field()), completed(description, KM_ORIGIN_GENERATED));

  const reply answer = ta.send(import_request(description, KEY));
  client::key_result imported;
  client::parse_imported(answer.output(), &imported);
  EXPECT_EQ(imported.characteristics, completed(hmac_key(256), KM_ORIGIN_IMPORTED));
  EXPECT_EQ(unseal(imported.blob),
            blob_plaintext(hmac_material(KEY), completed(description, KM_ORIGIN_IMPORTED)));
}

TEST(OpenKey, WantsTheBindingOfTheKey) {
  ta_under_test ta;
  const bytes blob = ta.generate(BOUND);
  const client::application right = app("id", "data");
  for (const client::application& given :
       {right, app("", ""), app("id", ""), app("", "data"), app("iD", "data"), app("i", "data"),
        app("id", "data1")}) {
    const bool opens = given.id == right.id && given.data == right.data;
    for (const auto& [asked, done] : {std::pair(command::GET_KEY_CHARACTER_SIZE, 0),
                                      {command::GET_KEY_CHARACTER, 0},
                                      {command::EXPORT_KEY, -17}}) {
      ta.expect_refused(key_request(asked, blob, given), opens ? done : -33);
      EXPECT_EQ(ta.trace().errors().ends_with(": Wrong AppId or AppData"), !opens);
    }
    param_set params;
    given.bind(&params);
    EXPECT_TRUE(refused(ta.upgrade(blob, params), opens ? 0 : -33));
  }
  const bytes free_blob = ta.generate(hmac_key(256));
  EXPECT_EQ(ta.characteristics(free_blob, app("any", "thing")).size(), 11u);
}

TEST(OpenKey, TellsShortBlobsApart) {
  ta_under_test ta;
  for (const size_t size : {0u, 1u, 2u, 93u}) {
    const bytes blob(size);
    for (const command id : {command::GET_KEY_CHARACTER_SIZE, command::GET_KEY_CHARACTER}) {
      EXPECT_TRUE(refused(ta.send(key_request(id, blob)), size < 2 ? -33 : -62)) << size;
      EXPECT_EQ(ta.trace().errors().ends_with(": Wrong key_blob_size 1"), size == 1);
    }
    EXPECT_TRUE(refused(ta.send(key_request(command::EXPORT_KEY, blob)), -62)) << size;
    EXPECT_EQ(ta.trace().errors(), "open_key: Too short key blob | export_key: Open key failed");
    EXPECT_TRUE(refused(ta.begin(SIGN, blob, mac_use()), -62)) << size;
    EXPECT_TRUE(refused(ta.send({.id = 21, .input = blob}), size < 2 ? -33 : 0)) << size;
    // upgrade_key goes on to the earlier TA, of which this device has none.
    EXPECT_TRUE(failed_with(ta.upgrade(blob), 0xFFFF0008)) << size;
  }
}

TEST(Version, KeysOpenUnderTheirOwnAlone) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  for (const auto& [version, patchlevel, open_error, upgrade_error] :
       {std::tuple(OS_VERSION, OS_PATCHLEVEL, 0, 0),
        {OS_VERSION + 1, OS_PATCHLEVEL, -62, 0},
        {OS_VERSION, OS_PATCHLEVEL + 1, -62, 0},
        {OS_VERSION - 1, OS_PATCHLEVEL, -33, -38},
        {OS_VERSION, OS_PATCHLEVEL - 1, -33, -38},
        {OS_VERSION + 1, OS_PATCHLEVEL - 1, -62, -38},
        {0x80000000, OS_PATCHLEVEL, -62, 0},  // compared without sign
        {OS_VERSION, 0x80000000, -62, 0},
        {0, 0, -33, -38}}) {
    SCOPED_TRACE(std::to_string(version) + ", " + std::to_string(patchlevel));
    ta.configure(version, patchlevel);
    for (const command id : {command::GET_KEY_CHARACTER_SIZE, command::GET_KEY_CHARACTER}) {
      ta.expect_refused(key_request(id, blob), open_error);
    }
    ta.expect_refused(key_request(command::EXPORT_KEY, blob), open_error == 0 ? -17 : open_error);
    ta.expect_refused(attest_request(blob), open_error == 0 ? -4 : open_error);
    EXPECT_TRUE(refused(ta.try_begin(SIGN, blob, mac_use()), open_error));
    const reply upgraded =
        ta.expect_refused(upgrade_request(blob), upgrade_error,
                          upgrade_error == 0 ? "" : "upgrade_key: Can't upgrade key params");
    if (upgrade_error != 0) continue;
    const param_set made = ta.characteristics(upgraded.output());
    EXPECT_EQ(made.numbers(KM_TAG_OS_VERSION), std::vector<uint64_t>{version});
    EXPECT_EQ(made.numbers(KM_TAG_OS_PATCHLEVEL), std::vector<uint64_t>{patchlevel});
  }
}

// Blobs whose version tags this TA would never write.
TEST(Version, UpgradeAddsMissingTagsAndRefusesRepeatedOnes) {
  ta_under_test ta({.rpmb = false});
  const bytes record = hmac_material(KEY);
  const bytes bare = seal(blob_plaintext(record, hmac_key(256)));
  EXPECT_TRUE(refused(ta.begin(SIGN, bare, mac_use()), -62));
  const param_set upgraded =
      hmac_key(256).add(KM_TAG_OS_VERSION, OS_VERSION).add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL);
  EXPECT_EQ(unseal(ta.upgrade(bare).output()), blob_plaintext(record, upgraded));
  // What a version tag holds beyond its 32 bits goes.
  bytes wide = blob_plaintext(record, upgraded);
  const bytes tag = client::field_writer().u32(KM_TAG_OS_VERSION).take();
  std::ranges::search(wide, tag).begin()[13] = 7;
  const reply narrowed = ta.upgrade(seal(wide));
  EXPECT_EQ(unseal(narrowed.output()), blob_plaintext(record, upgraded));
  const bytes repeated = seal(blob_plaintext(record, with(upgraded, KM_TAG_OS_VERSION, {1, 1})));
  EXPECT_TRUE(refused(ta.upgrade(repeated), -38));
}

}  // namespace
}  // namespace keymaster::test
