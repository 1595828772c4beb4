// What every command goes through before its handler runs, and the configured state.
#include <dlfcn.h>
#include <gtest/gtest.h>

#include "support/sets.h"
#include "support/ta_under_test.h"
#include "tee/runtime/instance.h"

namespace keymaster::test {
namespace {

constexpr TEEC_Result BAD_PARAMETERS = 0xFFFF0006;

struct command_row {
  uint32_t id;
  const char* name;
  uint32_t types;
  bool takes_a;  // slot 0 a is an input
  bool has_slot0 = true;
  bool wants_configured = true;
};

const command_row COMMANDS[] = {
    {13, "generate_key", 0x653, false},
    {14, "get_key_character_size", 0x53, false},
    {15, "get_key_character", 0x653, false},
    {16, "begin", 0x653, true},
    {17, "update", 0x653, true},
    {18, "finish", 0x653, true},
    {19, "import_key", 0x653, false},
    {20, "export_key", 0x653, false},
    {21, "delete_key", 0x53, false},
    {22, "delete_all_key", 0x3, false},
    {23, "_abort", 0x3, true},
    {24, "attest_key", 0x653, false},
    {25, "configure", 0x53, false, true, false},
    {26, "upgrade_key", 0x653, false},
    {0xFF00, "soter_handle_generate_attk_key_pair", 0x3, true, true, false},
    {0xFF01, "soter_handle_verify_attk_key_pair", 0x3, false, true, false},
    {0xFF02, "soter_handle_export_attk_public_key", 0x602, false, true, false},
    {0xFF03, "soter_handle_get_device_id", 0x602, false, true, false},
    {0xFF04, "soter_handle_setFid", 0x50, false, false, false},
};

std::string dispatcher(const std::string& message) {
  return "TA_InvokeCommandEntryPoint: " + message;
}

TEST(Dispatch, WantsTheExactTypes) {
  ta_under_test ta;
  for (const command_row& row : COMMANDS) {
    for (const uint32_t types : {0x0u, 0x1u, 0x2u, 0x3u, 0x5u, 0x50u, 0x53u, 0x63u, 0x350u, 0x553u,
                                 0x602u, 0x603u, 0x653u, 0x753u, 0x1653u, 0x5653u}) {
      if (types == row.types) continue;
      // The values are not looked at: else the message would be another one.
      EXPECT_TRUE(failed_with(
          ta.send({.id = row.id, .a = 1, .capacity = 64, .b = 1, .types = types}), BAD_PARAMETERS));
      const bool names_types = row.id == 0xFF04;
      char text[40];
      snprintf(text, sizeof(text), names_types ? "Bad argument type 0x%x" : "Bad argument type",
               types);
      EXPECT_EQ(ta.trace().errors(), dispatcher(text)) << row.name << " " << types;
      EXPECT_TRUE(ta.trace().has(dispatcher(row.name)));
    }
  }
}

TEST(Dispatch, WantsZerosInSlot0) {
  ta_under_test ta;
  for (const command_row& row : COMMANDS) {
    if ((row.types & 0xF) != TEEC_VALUE_INOUT) continue;
    for (const auto& [a, b] : {std::pair{1u, 0u}, {0x80000000u, 0u}, {0u, 1u}, {1u, 1u}}) {
      const reply answer = ta.send({.id = row.id, .a = a, .capacity = 64, .b = b});
      const bool allowed = b == 0 && row.takes_a;
      EXPECT_EQ(answer.res == BAD_PARAMETERS && ta.trace().has(dispatcher("Bad argument")),
                !allowed)
          << row.name << " " << a << " " << b;
      if (allowed) continue;
      EXPECT_EQ(static_cast<uint32_t>(answer.km_error), a) << "nothing is written back";
    }
  }
}

// The entry points without the TEE's part around them: in one instance, on the harness's device.
class EntryPoints : public testing::Test {
 protected:
  ~EntryPoints() override { dlclose(loaded); }

  template <typename F>
  F* entry(const char* name) {
    return reinterpret_cast<F*>(dlsym(loaded, name));
  }
  TEE_Result create() { return entry<TEE_Result()>("TA_CreateEntryPoint")(); }
  void destroy() { entry<void()>("TA_DestroyEntryPoint")(); }
  TEE_Result invoke(uint32_t id, uint32_t types, TEE_Param* params) {
    return entry<decltype(TA_InvokeCommandEntryPoint)>("TA_InvokeCommandEntryPoint")(nullptr, id,
                                                                                     types, params);
  }

  ta_under_test ta;
  std::unique_ptr<tee::device> device = (ta.stop(), tee::device::open(ta.path()));
  tee::instance instance{KEYMASTER_TA, *device, 1 << 20};
  tee::instance_scope running{instance};
  void* loaded = dlopen(KEYMASTER_TA_FILE, RTLD_NOW | RTLD_LOCAL);
};

// The client API clears value outputs on their way in, so this rule shows here alone.
TEST_F(EntryPoints, WantZerosInValueOutputsToo) {
  ASSERT_EQ(create(), TEE_SUCCESS);
  uint8_t room[16];
  for (const uint32_t id : {0xFF02u, 0xFF03u}) {
    for (const auto& [a, b] : {std::pair{0u, 0u}, {0u, 5u}, {5u, 0u}}) {
      TEE_Param params[4] = {};
      params[0].value = {a, b};
      params[2].memref = {room, sizeof(room)};
      EXPECT_EQ(invoke(id, 0x602, params) == BAD_PARAMETERS, a + b != 0) << id;
    }
  }
  destroy();
}

// A platform may run instances one after the other over the same globals.
TEST_F(EntryPoints, CreateForgetsTheInstanceBefore) {
  for (int life = 0; life < 2; life++) {
    ASSERT_EQ(create(), TEE_SUCCESS);
    TEE_Param unconfigured[4] = {};
    EXPECT_EQ(invoke(22, 0x3, unconfigured), TEE_SUCCESS);
    EXPECT_EQ(static_cast<int32_t>(unconfigured[0].value.a), KM_ERROR_KEYMASTER_NOT_CONFIGURED);
    uint8_t empty_set[4] = {};
    TEE_Param configure[4] = {};
    configure[1].memref = {empty_set, sizeof(empty_set)};
    EXPECT_EQ(invoke(25, 0x53, configure), TEE_SUCCESS);
    destroy();
    EXPECT_EQ(instance.counts().heap_blocks, 0u);
  }
}

TEST(Dispatch, RefusesUnknownCommands) {
  ta_under_test ta;
  for (const uint32_t id : {0u, 12u, 27u, 0xFEFFu, 0xFF05u, 0xFFFFFFFFu}) {
    EXPECT_TRUE(failed_with(ta.send({.id = id, .capacity = 8}), BAD_PARAMETERS));
    char text[40];
    snprintf(text, sizeof(text), "Unknown command %x", id);
    EXPECT_EQ(ta.trace().errors(), dispatcher(text));
  }
}

TEST(Dispatch, AnswersNothingBeforeConfigure) {
  ta_under_test ta({.configured = false});
  for (const command_row& row : COMMANDS) {
    if (row.id == 25) continue;
    const reply answer = ta.send({.id = row.id, .capacity = 64});
    if (!row.wants_configured) {
      EXPECT_NE(answer.km_error, KM_ERROR_KEYMASTER_NOT_CONFIGURED) << row.name;
      continue;
    }
    EXPECT_TRUE(refused(answer, KM_ERROR_KEYMASTER_NOT_CONFIGURED)) << row.name;
    EXPECT_EQ(ta.trace().errors(), std::string(row.name) + ": Not configured");
    const bool makes_key = row.id == 13 || row.id == 19;
    if (row.types == 0x653) {
      EXPECT_EQ(answer.buffer, bytes(64, makes_key ? 0 : UNTOUCHED)) << row.name;
    }
  }
}

bytes version_and_patchlevel(ta_under_test* ta) {
  const param_set made = ta->characteristics(ta->generate(hmac_key(256)));
  return client::field_writer()
      .u32(static_cast<uint32_t>(made.number(KM_TAG_OS_VERSION).value_or(999)))
      .u32(static_cast<uint32_t>(made.number(KM_TAG_OS_PATCHLEVEL).value_or(999)))
      .take();
}

TEST(Configure, KeepsWhatASetDoesNotName) {
  const param_set version = one(KM_TAG_OS_VERSION, 0x7530);
  const struct {
    const char* what;
    bytes set;
    TEEC_Result res;
    uint32_t version, patchlevel;  // afterwards
  } steps[] = {
      {"an empty set configures", param_set().marshal(), 0, 0, 0},
      {"one of the two", version.marshal(), 0, 0x7530, 0},
      {"other tags, and the last wins",
       one(KM_TAG_ALGORITHM, 1).add(KM_TAG_OS_PATCHLEVEL, 1).add(KM_TAG_OS_PATCHLEVEL, 2).marshal(),
       0, 0x7530, 2},
      {"not a set", {1, 0, 0, 0, 9}, BAD_PARAMETERS, 0x7530, 2},
      {"nothing", {}, BAD_PARAMETERS, 0x7530, 2},
      {"lower values", one(KM_TAG_OS_VERSION, 1).add(KM_TAG_OS_PATCHLEVEL, 1).marshal(), 0, 1, 1},
  };
  ta_under_test ta({.configured = false});
  const request broken = {.id = 25, .input = {1, 0, 0, 0}};
  EXPECT_TRUE(failed_with(ta.send(broken), BAD_PARAMETERS));
  EXPECT_EQ(ta.trace().errors(), "unmarshal: Too short input | configure: Unmarshal failed");
  EXPECT_TRUE(refused(ta.send({.id = 22}), KM_ERROR_KEYMASTER_NOT_CONFIGURED));
  for (const auto& step : steps) {
    EXPECT_TRUE(failed_with(ta.send({.id = 25, .input = step.set}), step.res)) << step.what;
    EXPECT_EQ(version_and_patchlevel(&ta),
              client::field_writer().u32(step.version).u32(step.patchlevel).take())
        << step.what;
  }
  ta.restart();
  EXPECT_TRUE(refused(ta.send({.id = 22}), KM_ERROR_KEYMASTER_NOT_CONFIGURED));
}

}  // namespace
}  // namespace keymaster::test
