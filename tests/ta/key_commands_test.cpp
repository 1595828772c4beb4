// The commands that make, describe, export, upgrade and delete keys.
#include <gtest/gtest.h>

#include "support/blob_forge.h"
#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

param_set unsupported(uint32_t algorithm) {
  return without(hmac_key(256), KM_TAG_ALGORITHM).append(one(KM_TAG_ALGORITHM, algorithm));
}

param_set bound() {
  return hmac_key(256)
      .add_bytes(KM_TAG_APPLICATION_ID, as_bytes("id"))
      .add_bytes(KM_TAG_APPLICATION_DATA, as_bytes("data"));
}

client::application app(std::string_view id, std::string_view data) {
  return {bytes(id.begin(), id.end()), bytes(data.begin(), data.end())};
}

TEST(MakeKey, RefusesAndClearsItsOutput) {
  const bytes data(32, 0x11);
  const struct {
    const char* what;
    param_set key;
    int32_t error;
    const char* generate_errors;
    const char* import_errors;
  } cases[] = {
      {"no algorithm", without(hmac_key(256), KM_TAG_ALGORITHM), -38,
       "generate_key: No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM",
       "import_key: No or too many KM_TAG_ALGORITHM"},
      {"two algorithms", hmac_key(256).append(one(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)), -38,
       "generate_key: No KM_TAG_ALGORITHM or many KM_TAG_ALGORITHM",
       "import_key: No or too many KM_TAG_ALGORITHM"},
      {"unknown algorithm", unsupported(2), -4, "",
       "import_key: Unsupport import_key for algorithm  (2)"},
      {"refused by the algorithm", hmac_key(256).append(one(KM_TAG_ORIGIN, 0)), -38,
       "hmac_generate_key: Shouldn't specify KM_TAG_ORIGIN",
       "hmac_import_key: Shouldn't specify KM_TAG_ORIGIN"},
      {"blob usage twice",
       hmac_key(256)
           .append(one(KM_TAG_BLOB_USAGE_REQUIREMENTS, 0))
           .append(one(KM_TAG_BLOB_USAGE_REQUIREMENTS, 0)),
       -40, "generate_key: Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified",
       "import_key: Too many KM_TAG_BLOB_USAGE_REQUIREMENTS specified"},
  };
  ta_under_test ta;
  for (const auto& c : cases) {
    const reply generated = ta.send(generate_request(c.key, 600));
    EXPECT_TRUE(refused(generated, c.error)) << c.what;
    EXPECT_EQ(ta.trace().errors(), c.generate_errors);
    EXPECT_EQ(generated.buffer, bytes(600)) << c.what;
    EXPECT_EQ(generated.output_size, 0u) << c.what;
    const reply imported = ta.send(import_request(c.key, data, 600));
    EXPECT_TRUE(refused(imported, c.error)) << c.what;
    EXPECT_EQ(ta.trace().errors(), c.import_errors);
    EXPECT_EQ(imported.buffer, bytes(600)) << c.what;
    EXPECT_EQ(imported.output_size, 600u) << c.what;  // left as it was
  }
}

TEST(MakeKey, RefusesWhatIsNoSet) {
  ta_under_test ta;
  const struct {
    uint32_t id;
    bytes input;
    TEEC_Result res;
    const char* errors;
  } cases[] = {
      {13, {1, 0, 0, 0}, 0xFFFF0006, "unmarshal: Too short input | generate_key: Unmarshal failed"},
      {19,
       {4, 0, 0, 0, 1, 0, 0, 0},
       0xFFFF0006,
       "unmarshal: Too short input | import_key: Unmarshal failed"},
      {19, {4, 0, 0, 0, 1, 0, 0}, 0xFFFF0000, "import_key: Too short input"},
      {19, {0xFF, 0xFF, 0xFF, 0xFF, 0, 0, 0, 0}, 0xFFFF0000, "import_key: Too short input"},
  };
  for (const auto& c : cases) {
    const reply answer = ta.send({.id = c.id, .input = c.input, .capacity = 10});
    EXPECT_TRUE(failed_with(answer, c.res));
    EXPECT_EQ(answer.buffer, bytes(10));
    EXPECT_EQ(ta.trace().errors(), c.errors);
  }
}

TEST(MakeKey, ImportWantsRoomForItsLengths) {
  ta_under_test ta;
  for (const size_t capacity : {0u, 3u, 4u, 7u, 8u}) {
    const reply answer = ta.send(import_request(hmac_key(), bytes(20, 0x0b), capacity));
    EXPECT_TRUE(failed_with(answer, capacity < 8 ? 0xFFFF0000 : 0xFFFF0010)) << capacity;
    EXPECT_EQ(ta.trace().has("import_key: Too short buffer"), capacity < 8) << capacity;
  }
}

TEST(MakeKey, CompletesTheCharacteristicsAndHidesTheBinding) {
  ta_under_test ta({.rpmb = false});
  const param_set description = bound().add_bytes(KM_TAG_ROOT_OF_TRUST, as_bytes("root"));
  const param_set added = one(KM_TAG_OS_VERSION, OS_VERSION)
                              .add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL)
                              .add(KM_TAG_CREATION_DATETIME, START_REE_MS / 1000 * 1000);
  const param_set generated =
      param_set(description).append(one(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED)).append(added);
  const param_set imported =
      param_set(description).append(one(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED)).append(added);
  const auto visible = [](const param_set& all) {
    return without(without(without(all, KM_TAG_APPLICATION_ID), KM_TAG_APPLICATION_DATA),
                   KM_TAG_ROOT_OF_TRUST);
  };

  const bytes blob = ta.generate(description);
  EXPECT_EQ(ta.characteristics(blob, app("id", "data")), visible(generated));
  EXPECT_EQ(ta.send(key_request(command::GET_KEY_CHARACTER_SIZE, blob, app("id", "data"))).b,
            visible(generated).marshal().size());
  const bytes plaintext = unseal(blob);
  client::field_reader sealed(plaintext);
  EXPECT_EQ(sealed.field().size(), 40u);
  EXPECT_EQ(param_set::parse(sealed.field()), generated);

  const bytes key(32, 0x11);
  const reply answer = ta.send(import_request(description, key));
  client::key_result result;
  client::parse_imported(answer.output(), &result);
  EXPECT_EQ(result.characteristics, visible(imported));
  EXPECT_EQ(unseal(result.blob), blob_plaintext(hmac_material(key), imported));
  EXPECT_EQ(answer.output_size, 4 + result.blob.size() + 4 + visible(imported).marshal().size());
}

TEST(OpenKey, WantsTheBindingOfTheKey) {
  ta_under_test ta;
  const bytes blob = ta.generate(bound());
  const bytes free_blob = ta.generate(hmac_key(256));
  const struct {
    const bytes& blob;
    client::application app;
    bool opens;
  } cases[] = {
      {blob, app("id", "data"), true},   {blob, app("", ""), false},
      {blob, app("id", ""), false},      {blob, app("", "data"), false},
      {blob, app("iD", "data"), false},  {blob, app("i", "data"), false},
      {blob, app("id", "data1"), false}, {free_blob, app("any", "thing"), true},
  };
  for (const auto& c : cases) {
    for (const command id : {command::GET_KEY_CHARACTER_SIZE, command::GET_KEY_CHARACTER}) {
      const reply answer = ta.send(key_request(id, c.blob, c.app));
      EXPECT_EQ(answer.km_error, c.opens ? 0 : -33);
      EXPECT_EQ(ta.trace().errors().ends_with("Wrong AppId or AppData"), !c.opens);
    }
    const int32_t exported = ta.send(key_request(command::EXPORT_KEY, c.blob, c.app)).km_error;
    EXPECT_EQ(exported, c.opens ? KM_ERROR_UNSUPPORTED_KEY_FORMAT : -33);
    param_set params;
    c.app.bind(&params);
    const reply upgraded = ta.upgrade(c.blob, params);
    EXPECT_EQ(upgraded.km_error, c.opens ? 0 : -33);
    EXPECT_EQ(upgraded.buffer == bytes(AMPLE, UNTOUCHED), !c.opens);
  }
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
    EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, blob, mac_use()), -62)) << size;
    EXPECT_TRUE(refused(ta.send({.id = 21, .input = blob}), size < 2 ? -33 : 0)) << size;
    // upgrade_key goes on to the earlier TA, of which this device has none.
    const reply upgraded = ta.upgrade(blob);
    EXPECT_TRUE(failed_with(upgraded, 0xFFFF0008));
    EXPECT_EQ(upgraded.output_size, AMPLE);
  }
}

TEST(Version, KeysOpenUnderTheirOwnAlone) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  const struct {
    uint32_t version, patchlevel;
    int32_t open_error, upgrade_error;
  } cases[] = {
      {OS_VERSION, OS_PATCHLEVEL, 0, 0},         {OS_VERSION + 1, OS_PATCHLEVEL, -62, 0},
      {OS_VERSION, OS_PATCHLEVEL + 1, -62, 0},   {OS_VERSION - 1, OS_PATCHLEVEL, -33, -38},
      {OS_VERSION, OS_PATCHLEVEL - 1, -33, -38}, {OS_VERSION + 1, OS_PATCHLEVEL - 1, -62, -38},
      {0x80000000, OS_PATCHLEVEL, -62, 0},  // compared without sign
      {OS_VERSION, 0x80000000, -62, 0},          {0, 0, -33, -38},
  };
  for (const auto& c : cases) {
    ta.configure(c.version, c.patchlevel);
    for (const command id : {command::GET_KEY_CHARACTER_SIZE, command::GET_KEY_CHARACTER}) {
      EXPECT_EQ(ta.send(key_request(id, blob)).km_error, c.open_error) << c.version;
    }
    EXPECT_EQ(ta.send(key_request(command::EXPORT_KEY, blob)).km_error,
              c.open_error == 0 ? KM_ERROR_UNSUPPORTED_KEY_FORMAT : c.open_error);
    const reply begun = ta.begin(KM_PURPOSE_SIGN, blob, mac_use());
    EXPECT_EQ(begun.km_error, c.open_error) << c.version;
    if (begun.ok()) ta.abort(begun.b);

    const reply upgraded = ta.upgrade(blob);
    EXPECT_TRUE(refused(upgraded, c.upgrade_error)) << c.version << " " << c.patchlevel;
    if (c.upgrade_error != 0) {
      EXPECT_EQ(ta.trace().errors(), "upgrade_key: Can't upgrade key params");
      EXPECT_EQ(upgraded.buffer, bytes(AMPLE, UNTOUCHED));
      EXPECT_EQ(upgraded.output_size, AMPLE);
      continue;
    }
    const param_set made = ta.characteristics(upgraded.output());
    EXPECT_EQ(made.numbers(KM_TAG_OS_VERSION), std::vector<uint64_t>{c.version});
    EXPECT_EQ(made.numbers(KM_TAG_OS_PATCHLEVEL), std::vector<uint64_t>{c.patchlevel});
  }
}

// Blobs whose version tags this TA would never write.
TEST(Version, UpgradeAddsMissingTagsAndRefusesRepeatedOnes) {
  ta_under_test ta({.rpmb = false});
  const bytes key(32, 0x11);
  const bytes record = hmac_material(key);
  const bytes bare = seal(blob_plaintext(record, hmac_key(256)));
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, bare, mac_use()), -62));
  const reply upgraded = ta.upgrade(bare);
  EXPECT_EQ(unseal(upgraded.output()),
            blob_plaintext(record, hmac_key(256)
                                       .add(KM_TAG_OS_VERSION, OS_VERSION)
                                       .add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL)));
  EXPECT_TRUE(succeeded(ta.send(key_request(command::GET_KEY_CHARACTER, upgraded.output()))));

  const bytes twice = seal(
      blob_plaintext(record, hmac_key(256).add(KM_TAG_OS_VERSION, 1).add(KM_TAG_OS_VERSION, 1)));
  EXPECT_TRUE(refused(ta.begin(KM_PURPOSE_SIGN, twice, mac_use()), -62));
  EXPECT_TRUE(refused(ta.upgrade(twice), -38));
}

// Keys live in their blobs alone.
TEST(Delete, ErasesNothing) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256));
  EXPECT_TRUE(succeeded(ta.send({.id = 21, .input = blob})));
  EXPECT_TRUE(succeeded(ta.send({.id = 22})));
  EXPECT_TRUE(succeeded(ta.send(key_request(command::GET_KEY_CHARACTER, blob))));
}

TEST(Export, OfMarkedKeysIsAlwaysDone) {
  ta_under_test ta;
  const bytes blob = ta.generate(hmac_key(256).add_flag(KM_TAG_SOTER_KEY));
  EXPECT_TRUE(succeeded(ta.send(key_request(command::EXPORT_KEY, blob))));
}

}  // namespace
}  // namespace keymaster::test
