// The vault's client against a vault that is played here: arguments, sessions, lengths.
#include "vault/vault.h"

#include <gtest/gtest.h>

#include "platform.h"

namespace {

TEE_Result open_result;
TEE_Result invoke_result;
uint32_t claimed;  // how many bytes the vault says it wrote
int sessions;      // open now
int calls;         // of the vault, so far

}  // namespace

TEE_Result TEE_OpenTASession(const TEE_UUID*, uint32_t, uint32_t, TEE_Param*,
                             TEE_TASessionHandle* session, uint32_t*) {
  if (open_result == TEE_SUCCESS) {
    *session = reinterpret_cast<TEE_TASessionHandle>(uintptr_t{1});
    sessions++;
  }
  return open_result;
}

TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle, uint32_t, uint32_t command, uint32_t,
                               TEE_Param* params, uint32_t*) {
  calls++;
  if (command == 12) {
    params[1].memref.size = claimed;
  } else {
    params[1].value.a = claimed;
  }
  return invoke_result;
}

void TEE_CloseTASession(TEE_TASessionHandle) {
  sessions--;
}

namespace keymaster {
namespace {

constexpr uint8_t REQUEST[4] = {};

TEST(VaultClient, ChecksWhatItIsGivenBeforeItAsks) {
  platform::reset();
  calls = 0;
  uint8_t buffer[8];
  size_t length = sizeof(buffer);
  EXPECT_EQ(retrieve_key_from_vault(nullptr, 8, &length), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(retrieve_data_from_vault(nullptr, 8, &length), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(retrieve_key_from_vault(buffer, 8, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(retrieve_property_from_vault(nullptr, buffer, &length), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(retrieve_property_from_vault(REQUEST, nullptr, &length), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(retrieve_property_from_vault(REQUEST, buffer, nullptr), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(calls, 0);
}

TEST(VaultClient, TakesTheLengthOfASuccessAlone) {
  const struct {
    TEE_Result open, invoke;
    uint32_t claims;
    TEE_Result result;
    size_t length;  // 8 before the call
  } rows[] = {
      {TEE_SUCCESS, TEE_SUCCESS, 5, TEE_SUCCESS, 5},
      {TEE_SUCCESS, TEE_SUCCESS, 8, TEE_SUCCESS, 8},
      {TEE_SUCCESS, TEE_SUCCESS, 9, TEE_ERROR_GENERIC, 8},
      {TEE_SUCCESS, TEE_ERROR_BUSY, 5, TEE_ERROR_BUSY, 8},
      {TEE_ERROR_ITEM_NOT_FOUND, TEE_SUCCESS, 5, TEE_ERROR_ITEM_NOT_FOUND, 8},
  };
  for (const auto& row : rows) {
    open_result = row.open;
    invoke_result = row.invoke;
    claimed = row.claims;
    uint8_t buffer[8];
    size_t lengths[] = {8, 8, 8};
    EXPECT_EQ(retrieve_key_from_vault(buffer, 8, &lengths[0]), row.result);
    EXPECT_EQ(retrieve_data_from_vault(buffer, 8, &lengths[1]), row.result);
    EXPECT_EQ(retrieve_property_from_vault(REQUEST, buffer, &lengths[2]), row.result);
    for (const size_t length : lengths)
      EXPECT_EQ(length, row.length);
    EXPECT_EQ(sessions, 0) << "all closed";
  }
}

}  // namespace
}  // namespace keymaster
