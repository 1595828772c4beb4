// The client API: contexts, parameters, shared memory, bad input.
#include "tee_client_api.h"
#include "tee_extensions.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <optional>
#include <stdlib.h>

#include "tests/tee/client.h"
#include "tests/tee/served_device.h"
#include "tests/tee/ta_echo/echo_ta.h"

namespace tee::test {
namespace {

// Both ways to a TEE: in the process, and in one that serves the device.
class teec_both : public ::testing::TestWithParam<bool> {
 protected:
  static std::string name_of(const temp_device& device) {
    return GetParam() ? "teed:" + device.path() : device.path();
  }

  temp_device made;
  std::optional<served_device> served =
      GetParam() ? std::make_optional<served_device>(made.path()) : std::nullopt;
  client user{name_of(made), echo::FIRST};
};
INSTANTIATE_TEST_SUITE_P(local, teec_both, ::testing::Values(false));
INSTANTIATE_TEST_SUITE_P(served, teec_both, ::testing::Values(true));

class teec : public ::testing::Test {
 protected:
  temp_device made;
  client user{made.path(), echo::FIRST};
};

constexpr uint32_t MIRROR_TYPES = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT,
                                                   TEEC_MEMREF_TEMP_OUTPUT, TEEC_VALUE_OUTPUT);

TEST_P(teec_both, registered_and_allocated_memory) {
  std::string bytes = "0123456789";
  TEEC_SharedMemory in{bytes.data(), bytes.size(), TEEC_MEM_INPUT, nullptr};
  TEEC_SharedMemory out{nullptr, 8, TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, nullptr};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&user.context, &in), TEEC_SUCCESS);
  ASSERT_EQ(TEEC_AllocateSharedMemory(&user.context, &out), TEEC_SUCCESS);
  client other(name_of(made), echo::SECOND);
  TEEC_SharedMemory foreign = in;
  ASSERT_EQ(TEEC_RegisterSharedMemory(&other.context, &foreign), TEEC_SUCCESS);
  TEEC_SharedMemory stale = in;
  stale.imp = nullptr;

  constexpr uint32_t WHOLE = TEEC_MEMREF_WHOLE;
  constexpr uint32_t PART_IN = TEEC_MEMREF_PARTIAL_INPUT;
  constexpr uint32_t PART_OUT = TEEC_MEMREF_PARTIAL_OUTPUT;
  constexpr TEEC_Result BAD = TEEC_ERROR_BAD_PARAMETERS;
  struct {
    uint32_t in_type;
    TEEC_RegisteredMemoryReference in;
    uint32_t out_type;
    TEEC_RegisteredMemoryReference out;
    TEEC_Result result;
    size_t size;  // of the output slot afterwards
  } cases[] = {
      {PART_IN, {&in, 4, 6}, PART_OUT, {&out, 5, 3}, 0, 4},
      {WHOLE, {&in, 0, 0}, WHOLE, {&out, 0, 0}, TEEC_ERROR_SHORT_BUFFER, 10},
      {PART_IN, {&in, 0, 10}, WHOLE, {&out, 0, 0}, 0, 0},
      {PART_IN, {&in, 5, 6}, WHOLE, {&out, 9, 0}, BAD, 9},
      {PART_IN, {&in, 2, SIZE_MAX}, WHOLE, {&out, 9, 0}, BAD, 9},
      {PART_IN, {&in, SIZE_MAX, 2}, WHOLE, {&out, 9, 0}, BAD, 9},
      {WHOLE, {&in, 0, 0}, PART_OUT, {&in, 9, 0}, BAD, 9},
      {WHOLE, {nullptr, 0, 0}, WHOLE, {&out, 9, 0}, BAD, 9},
      {WHOLE, {&foreign, 0, 0}, WHOLE, {&out, 9, 0}, BAD, 9},
      {WHOLE, {&stale, 0, 0}, WHOLE, {&out, 9, 0}, BAD, 9},
  };
  for (const auto& row : cases) {
    TEEC_Operation operation{};
    operation.paramTypes =
        TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, row.in_type, row.out_type, TEEC_VALUE_OUTPUT);
    operation.params[1].memref = row.in;
    operation.params[2].memref = row.out;
    EXPECT_EQ(user.invoke(echo::MIRROR, &operation), row.result);
    EXPECT_EQ(operation.params[2].memref.size, row.size);
    if (row.result == TEEC_SUCCESS) {
      EXPECT_EQ(memcmp(static_cast<char*>(out.buffer) + row.out.offset,
                       bytes.data() + row.in.offset, row.in.size),
                0);
    }
  }
  TEEC_ReleaseSharedMemory(&in);
  TEEC_ReleaseSharedMemory(&in);
  TEEC_ReleaseSharedMemory(&out);
  EXPECT_EQ(out.buffer, nullptr);
  for (auto [buffer, size, flags, expected] :
       {std::tuple{bytes.data(), size_t{10}, 0u, TEEC_ERROR_BAD_PARAMETERS},
        {static_cast<char*>(nullptr), size_t{10}, 1u, TEEC_ERROR_BAD_PARAMETERS},
        {bytes.data(), size_t{TEEC_CONFIG_SHAREDMEM_MAX_SIZE} + 1, 1u, TEEC_ERROR_OUT_OF_MEMORY}}) {
    TEEC_SharedMemory memory{buffer, size, flags, nullptr};
    EXPECT_EQ(TEEC_RegisterSharedMemory(&user.context, &memory), expected);
  }
}

// Small ones and large ones take different ways.
TEST_P(teec_both, bytes_arrive_whatever_their_size) {
  for (size_t size : {0, 1, 7, 8, 16'000, 32'768, 40'000, 3'000'000}) {
    SCOPED_TRACE(size);
    std::string in(size, '\0');
    for (size_t i = 0; i < size; i++)
      in[i] = static_cast<char>(i * 31 >> 3);
    for (uint32_t out_type : {TEEC_MEMREF_TEMP_OUTPUT, TEEC_MEMREF_TEMP_INOUT}) {
      for (size_t spare : {0, 100}) {
        std::string out(size + spare, 'x');
        TEEC_Operation operation{};
        operation.paramTypes =
            TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, out_type, TEEC_VALUE_OUTPUT);
        operation.params[0].value = {1, 2};
        operation.params[1].tmpref = {in.data(), in.size()};
        operation.params[2].tmpref = {out.data(), out.size()};
        EXPECT_EQ(user.invoke(echo::MIRROR, &operation), TEEC_SUCCESS);
        EXPECT_EQ(operation.params[0].value.a, 2u);
        EXPECT_EQ(operation.params[2].tmpref.size, size);
        EXPECT_EQ(out, in + std::string(spare, 'x'));
        if (size == 0) continue;
        operation.params[2].tmpref = {out.data(), size - 1};
        EXPECT_EQ(user.invoke(echo::MIRROR, &operation), TEEC_ERROR_SHORT_BUFFER);
        EXPECT_EQ(operation.params[2].tmpref.size, size);
      }
    }
  }
}

TEST_P(teec_both, bad_calls_are_refused) {
  for (uint32_t types : {4u, 8u, 0xBu, 0x40u, 0x10000u, 0xFFFF0000u}) {
    TEEC_Operation operation{};
    operation.paramTypes = types;
    EXPECT_EQ(user.invoke(echo::MIRROR, &operation), TEEC_ERROR_BAD_PARAMETERS) << types;
    EXPECT_EQ(user.origin, TEEC_ORIGIN_API);
  }
  TEEC_Operation operation{};
  operation.paramTypes = MIRROR_TYPES;
  operation.params[1].tmpref = {nullptr, 1};
  EXPECT_EQ(user.invoke(echo::MIRROR, &operation), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(user.invoke(99, nullptr), TEEC_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(user.origin, TEEC_ORIGIN_TRUSTED_APP);

  // The trusted application's refusal to open a session gives its outputs, and no session.
  operation = {};
  operation.paramTypes = TEEC_VALUE_INOUT;
  operation.params[0].value.a = TEEC_ERROR_EXCESS_DATA;
  EXPECT_EQ(user.open_session(echo::FIRST, &operation), TEEC_ERROR_EXCESS_DATA);
  EXPECT_EQ(operation.params[0].value.b, 3u);
  EXPECT_EQ(user.origin, TEEC_ORIGIN_TRUSTED_APP);
  EXPECT_EQ(user.invoke(echo::MIRROR, nullptr), TEEC_ERROR_BAD_PARAMETERS);

  EXPECT_EQ(user.open_session({1, 1, 1, {}}), TEEC_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(user.origin, TEEC_ORIGIN_TEE);
  TEEC_UUID uuid = to_client(echo::FIRST);
  EXPECT_EQ(TEEC_OpenSession(nullptr, &user.session, &uuid, 0, nullptr, nullptr, nullptr),
            TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEEC_InvokeCommand(nullptr, 0, nullptr, nullptr), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_CloseSession(nullptr);
  TEEC_FinalizeContext(nullptr);
}

TEST_P(teec_both, a_context_that_ends_takes_its_sessions_along) {
  TEEC_Session copy = user.session;
  TEEC_FinalizeContext(&user.context);
  EXPECT_EQ(TEEC_InvokeCommand(&copy, echo::MIRROR, nullptr, nullptr), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_CloseSession(&copy);
  if (!served) {
    EXPECT_NE(made.open(), nullptr);
  }
}

// Files that are no library; the last one is a program.
TEST_F(teec, applications_that_do_not_load) {
  constexpr TEE_UUID BROKEN = {0xb0, 0, 0, {}};
  const std::string file = made.path() + "/../000000b0-0000-0000-0000-000000000000.ta";
  setenv("TEE_TA_PATH", (made.path() + "/..").c_str(), 1);
  host::set_trace_level(0);
  for (const std::string& content :
       {std::string(), std::string("no library"), content_of("/proc/self/exe")}) {
    set_content(file, content);
    EXPECT_EQ(user.open_session(BROKEN), TEEC_ERROR_BAD_FORMAT);
    EXPECT_EQ(user.origin, uint32_t{TEEC_ORIGIN_TEE});
  }
  host::set_trace_level(TEE_TRACE_ERROR);
  setenv("TEE_TA_PATH", TEST_TA_PATH, 1);
  EXPECT_EQ(user.open_session(echo::SECOND), TEEC_SUCCESS);
}

TEST_F(teec, contexts_that_cannot_be) {
  host::set_trace_level(0);
  TEEC_Context context{};
  for (const std::string way : {"", "local:", "teed:"}) {
    const auto open = [&](const temp_device& device, const char* below = "") {
      return TEEC_InitializeContext((way + device.path() + below).c_str(), &context);
    };
    EXPECT_EQ(open(made, "/none"), TEEC_ERROR_ITEM_NOT_FOUND);
    EXPECT_EQ(TEEC_InitializeContext(way.c_str(), nullptr), TEEC_ERROR_BAD_PARAMETERS);
    temp_device held;
    auto holder = held.open();
    EXPECT_EQ(open(held), TEEC_ERROR_BUSY);
    holder.reset();
    set_content(held.file("device.key"), "");
    EXPECT_EQ(open(held), TEEC_ERROR_BAD_FORMAT);
  }
  setenv("KEYMASTER_DEVICE", made.path().c_str(), 1);
  EXPECT_EQ(TEEC_InitializeContext(nullptr, &context), TEEC_SUCCESS);
  TEEC_FinalizeContext(&context);
  unsetenv("KEYMASTER_DEVICE");
  host::set_trace_level(TEE_TRACE_ERROR);
}

}  // namespace
}  // namespace tee::test
