// What every command goes through before its handler runs, and the configured state.
#include <dlfcn.h>

#include "support/sets.h"
#include "support/ta_folders.h"
#include "support/ta_under_test.h"
#include "tee/core/instance.h"

namespace keymaster::test {
namespace {

constexpr TEEC_Result BAD_PARAMETERS = 0xFFFF0006;

struct command_row {
  uint32_t id;
  const char* name;
  uint32_t types;
  bool takes_a;  // slot 0 a is an input
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
    {25, "configure", 0x53, false, false},
    {26, "upgrade_key", 0x653, false},
    {0xFF00, "soter_handle_generate_attk_key_pair", 0x3, true, false},
    {0xFF01, "soter_handle_verify_attk_key_pair", 0x3, false, false},
    {0xFF02, "soter_handle_export_attk_public_key", 0x602, false, false},
    {0xFF03, "soter_handle_get_device_id", 0x602, false, false},
    {0xFF04, "soter_handle_setFid", 0x50, false, false},
};

std::string hex(const char* message, uint32_t number) {
  char text[64];
  snprintf(text, sizeof(text), "TA_InvokeCommandEntryPoint: %s%x", message, number);
  return text;
}

TEST(Dispatch, WantsTheExactTypes) {
  ta_under_test ta;
  for (const command_row& row : COMMANDS) {
    for (const uint32_t types : {0x0u, 0x1u, 0x2u, 0x3u, 0x5u, 0x50u, 0x53u, 0x63u, 0x350u, 0x553u,
                                 0x602u, 0x603u, 0x653u, 0x753u, 0x1653u, 0x5653u}) {
      if (types == row.types) continue;
      // The values are not looked at: else the message would be another one.
      const request what = {.id = row.id, .a = 1, .capacity = 64, .b = 1, .types = types};
      EXPECT_TRUE(failed_with(ta.send(what), BAD_PARAMETERS));
      EXPECT_EQ(ta.trace().errors(), row.id == 0xFF04
                                         ? hex("Bad argument type 0x", types)
                                         : "TA_InvokeCommandEntryPoint: Bad argument type");
      EXPECT_TRUE(ta.trace().has(std::string("TA_InvokeCommandEntryPoint: ") + row.name));
    }
  }
}

TEST(Dispatch, WantsZerosInSlot0) {
  ta_under_test ta;
  for (const command_row& row : COMMANDS) {
    if ((row.types & 0xF) != TEEC_VALUE_INOUT) continue;
    for (const auto& [a, b] : {std::pair{1u, 0u}, {0x80000000u, 0u}, {0u, 1u}, {1u, 1u}}) {
      const reply answer = ta.send({.id = row.id, .a = a, .capacity = 64, .b = b});
      const bool refused = ta.trace().has("TA_InvokeCommandEntryPoint: Bad argument");
      EXPECT_EQ(refused, b != 0 || !row.takes_a) << row.name << " " << a << " " << b;
      if (!refused) continue;
      EXPECT_TRUE(failed_with(answer, BAD_PARAMETERS));
      EXPECT_EQ(static_cast<uint32_t>(answer.km_error), a) << "nothing is written back";
    }
  }
}

TEST(Dispatch, RefusesUnknownCommands) {
  ta_under_test ta;
  for (const uint32_t id : {0u, 12u, 27u, 0xFEFFu, 0xFF05u, 0xFFFFFFFFu}) {
    EXPECT_TRUE(failed_with(ta.send({.id = id, .capacity = 8}), BAD_PARAMETERS));
    EXPECT_EQ(ta.trace().errors(), hex("Unknown command ", id));
  }
}

TEST(Dispatch, AnswersNothingBeforeConfigure) {
  ta_under_test ta({.configured = false});
  for (const command_row& row : COMMANDS) {
    if (row.id == 25) continue;
    const reply answer = ta.send({.id = row.id, .capacity = 64});
    EXPECT_EQ(answer.km_error == KM_ERROR_KEYMASTER_NOT_CONFIGURED, row.wants_configured);
    if (!row.wants_configured) continue;
    EXPECT_EQ(answer.res, TEEC_SUCCESS) << row.name;
    EXPECT_EQ(ta.trace().errors(), std::string(row.name) + ": Not configured");
    const bool clears = row.id == 13 || row.id == 19;
    if (row.types != 0x653) continue;
    EXPECT_EQ(answer.buffer, bytes(64, clears ? 0 : UNTOUCHED)) << row.name;
  }
}

// The entry points without the TEE's part around them. A platform may run instances one after the
// other over the same globals; and the client API clears value outputs on their way in, so the rule
// that these be zero shows here alone.
TEST(EntryPoints, CreateForgetsTheInstanceBefore) {
  ta_under_test ta;
  ta.stop();
  const auto device = tee::device::open(ta.path());
  tee::instance instance(KEYMASTER_TA, *device, 1 << 20);
  tee::instance_scope running(instance);
  void* loaded = dlopen(keymaster_file().c_str(), RTLD_NOW | RTLD_LOCAL);
  const auto create = reinterpret_cast<TEE_Result (*)()>(dlsym(loaded, "TA_CreateEntryPoint"));
  const auto destroy = reinterpret_cast<void (*)()>(dlsym(loaded, "TA_DestroyEntryPoint"));
  const auto invoke = reinterpret_cast<decltype(&TA_InvokeCommandEntryPoint)>(
      dlsym(loaded, "TA_InvokeCommandEntryPoint"));
  for (int life = 0; life < 2; life++) {
    ASSERT_EQ(create(), TEE_SUCCESS);
    TEE_Param params[4] = {};
    EXPECT_EQ(invoke(nullptr, 22, 0x3, params), TEE_SUCCESS);
    EXPECT_EQ(static_cast<int32_t>(params[0].value.a), KM_ERROR_KEYMASTER_NOT_CONFIGURED);
    uint8_t memory[16] = {};
    params[0].value = {0, 0};
    params[1].memref = {memory, 4};
    EXPECT_EQ(invoke(nullptr, 25, 0x53, params), TEE_SUCCESS);
    for (const auto& [a, b] : {std::pair{0u, 0u}, {0u, 5u}, {5u, 0u}}) {
      for (const uint32_t id : {0xFF02, 0xFF03}) {
        params[0].value = {a, b};
        params[2].memref = {memory, sizeof(memory)};
        EXPECT_EQ(invoke(nullptr, id, 0x602, params) == BAD_PARAMETERS, a + b != 0);
      }
    }
    destroy();
    EXPECT_EQ(instance.counts().heap_blocks, 0u);
  }
  dlclose(loaded);
}

TEST(Configure, KeepsWhatASetDoesNotName) {
  // What is sent, its answer, and the two values afterwards.
  const std::tuple<const char*, bytes, TEEC_Result, uint32_t, uint32_t> steps[] = {
      {"an empty set configures", param_set().marshal(), 0, 0, 0},
      {"one of the two", one(KM_TAG_OS_VERSION, 0x7530).marshal(), 0, 0x7530, 0},
      {"other tags, and the last wins",
       one(KM_TAG_ALGORITHM, 1).add(KM_TAG_OS_PATCHLEVEL, 1).add(KM_TAG_OS_PATCHLEVEL, 2).marshal(),
       0, 0x7530, 2},
      {"not a set", {1, 0, 0, 0, 9}, BAD_PARAMETERS, 0x7530, 2},
      {"nothing", {}, BAD_PARAMETERS, 0x7530, 2},
      {"lower values", one(KM_TAG_OS_VERSION, 1).add(KM_TAG_OS_PATCHLEVEL, 1).marshal(), 0, 1, 1},
  };
  ta_under_test ta({.configured = false});
  EXPECT_TRUE(failed_with(ta.send({.id = 25, .input = {1, 0, 0, 0}}), BAD_PARAMETERS));
  EXPECT_EQ(ta.trace().errors(), "unmarshal: Too short input | configure: Unmarshal failed");
  EXPECT_TRUE(refused(ta.send({.id = 22}), KM_ERROR_KEYMASTER_NOT_CONFIGURED));
  for (const auto& [what, set, res, version, patchlevel] : steps) {
    EXPECT_TRUE(failed_with(ta.send({.id = 25, .input = set}), res)) << what;
    const param_set made = ta.characteristics(ta.generate(hmac_key(256)));
    EXPECT_EQ(made.number(KM_TAG_OS_VERSION), version) << what;
    EXPECT_EQ(made.number(KM_TAG_OS_PATCHLEVEL), patchlevel) << what;
  }
}

}  // namespace
}  // namespace keymaster::test
