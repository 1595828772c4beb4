// Instances and sessions: life, identity, sharing, cycles.
#include "tee_client_api.h"
#include "tee_extensions.h"

#include <cstring>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include "tee/api/ta_parameters.h"
#include "tests/tee/client.h"
#include "tests/tee/ta_echo/echo_ta.h"

namespace tee::test {
namespace {

class sessions : public ::testing::Test {
 protected:
  temp_device made;
};

// Has the identities of `path` called in turn; *identity is the client that the last one saw.
TEEC_Result relay(client& from, std::vector<TEE_UUID> path, std::string* identity,
                  uint32_t* inner_origin = nullptr) {
  char text[64] = {};
  TEEC_Operation operation{};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT,
                                          TEEC_VALUE_OUTPUT, TEEC_NONE);
  operation.params[0].tmpref = {path.data(), path.size() * sizeof(TEE_UUID)};
  operation.params[1].tmpref = {text, sizeof(text)};
  TEEC_Result result = from.invoke(echo::RELAY, &operation);
  *identity = text;
  if (inner_origin != nullptr) *inner_origin = operation.params[2].value.a;
  return result;
}

TEST_F(sessions, what_a_trusted_application_leaves_is_counted_and_reported) {
  std::string trace;
  host::set_trace_sink([](void* out, uint32_t, const char* line,
                          size_t length) { static_cast<std::string*>(out)->append(line, length); },
                       &trace);
  {
    client user(made.path(), echo::FIRST);
    EXPECT_EQ(user.invoke(echo::LEAK, nullptr), TEEC_SUCCESS);
    EXPECT_EQ(user.invoke(echo::KEEP_SESSION, nullptr), TEEC_SUCCESS);
    host::live_counts counts;
    ASSERT_TRUE(host::counts_of(echo::FIRST, &counts));
    EXPECT_EQ(counts, (host::live_counts{100, 1, 0, 0, 1}));
  }
  host::set_trace_sink(nullptr, nullptr);
  EXPECT_NE(trace.find("1f3c5e70-0001-4a00-8000-000000000001 ended with 1 heap blocks (100 bytes)"),
            std::string::npos)
      << trace;
}

// Two users of one device, by the ways around its lock.
TEST_F(sessions, a_device_is_not_shared_by_fork_or_by_moving_its_folder) {
  client user(made.path(), echo::FIRST);
  const auto try_context = [&] {
    TEEC_Context other{};
    const TEEC_Result res = TEEC_InitializeContext(made.path().c_str(), &other);
    TEEC_FinalizeContext(&other);
    return res;
  };
  const pid_t child = fork();
  if (child == 0) {
    const bool refused = user.invoke(echo::LEAK, nullptr) == TEEC_ERROR_BAD_STATE &&
                         user.open_session(echo::SECOND) == TEEC_ERROR_BAD_STATE &&
                         try_context() == TEEC_ERROR_BUSY;
    _exit(refused ? 0 : 1);
  }
  int status = 1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);

  temp_device other;
  std::filesystem::rename(made.path(), made.path() + ".away");
  std::filesystem::rename(other.path(), made.path());
  EXPECT_EQ(try_context(), TEEC_ERROR_BUSY);
  EXPECT_EQ(user.open_session(echo::SECOND), TEEC_SUCCESS);
  user.close_context();
  EXPECT_EQ(try_context(), TEEC_SUCCESS);
}

// Memory of size 0 is there for the callee when it is for the caller.
TEST_F(sessions, references_of_size_0_stay_null_or_not) {
  uint8_t byte = 0;
  for (void* buffer : {static_cast<void*>(&byte), static_cast<void*>(nullptr)}) {
    for (uint32_t type : {TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT}) {
      TEE_Param own[4] = {};
      own[0].memref = {buffer, 0};
      ta_parameters copies("test", type, own);
      EXPECT_EQ(copies.for_callee()->slots[0].memref.buffer != nullptr, buffer != nullptr);
      copies.copy_back(own);
      EXPECT_EQ(own[0].memref.buffer, buffer);
    }
  }
}

TEST_F(sessions, the_callee_sees_who_calls) {
  const TEE_UUID missing = {9, 9, 9, {}};
  // A path, its result and origin, and whom the last one sees.
  const std::tuple<std::vector<TEE_UUID>, TEEC_Result, uint32_t, const char*> cases[] = {
      {{}, TEEC_SUCCESS, 0, "0:00000000-0000-0000-0000-000000000000"},
      {{echo::SECOND},
       TEEC_SUCCESS,
       TEEC_ORIGIN_TRUSTED_APP,
       "4026531840:1f3c5e70-0001-4a00-8000-000000000001"},
      {{missing}, TEEC_ERROR_ITEM_NOT_FOUND, TEEC_ORIGIN_TEE, ""},
      {{echo::FIRST}, TEEC_ERROR_BUSY, TEEC_ORIGIN_TEE, ""},
      {{echo::SECOND, echo::FIRST}, TEEC_ERROR_BUSY, TEEC_ORIGIN_TRUSTED_APP, ""},
  };
  client user(made.path(), echo::FIRST);
  host::set_trace_level(0);
  for (const auto& [path, result, wanted_origin, wanted_identity] : cases) {
    std::string identity;
    uint32_t inner_origin = 0;
    EXPECT_EQ(relay(user, path, &identity, &inner_origin), result);
    EXPECT_EQ(inner_origin, wanted_origin);
    EXPECT_EQ(identity, wanted_identity);
  }
  host::set_trace_level(TEE_TRACE_ERROR);
}

TEST_F(sessions, logins_are_derived_and_checked) {
  client user(made.path(), echo::FIRST);
  uint32_t own_group = getegid();
  uint32_t no_group = 0xFFFFFFF0;
  const std::tuple<uint32_t, const void*, TEEC_Result, const char*> cases[] = {
      {TEEC_LOGIN_USER, nullptr, TEEC_SUCCESS, "1:"},
      {TEEC_LOGIN_GROUP, &own_group, TEEC_SUCCESS, "2:"},
      {TEEC_LOGIN_APPLICATION, nullptr, TEEC_SUCCESS, "4:"},
      {TEEC_LOGIN_GROUP, &no_group, TEEC_ERROR_ACCESS_DENIED, ""},
      {TEEC_LOGIN_GROUP, nullptr, TEEC_ERROR_BAD_PARAMETERS, ""},
      {TEEC_LOGIN_PUBLIC, &own_group, TEEC_ERROR_BAD_PARAMETERS, ""},
      {TEE_LOGIN_TRUSTED_APP, nullptr, TEEC_ERROR_BAD_PARAMETERS, ""},
  };
  for (const auto& [method, data, result, begins] : cases) {
    EXPECT_EQ(user.open_session(echo::FIRST, nullptr, method, data), result);
    if (result != TEEC_SUCCESS) continue;
    std::string identity;
    EXPECT_EQ(relay(user, {}, &identity), TEEC_SUCCESS);
    EXPECT_EQ(identity.rfind(begins, 0), 0u) << identity;
    EXPECT_EQ(identity[2 + 14], '5') << identity;  // the UUID's version
  }
}

// Each identity calls the other from a thread of its own, so that they keep meeting halfway.
TEST_F(sessions, callers_that_wait_for_each_other_are_told_and_never_hang) {
  client first(made.path(), echo::FIRST);
  client second(made.path(), echo::SECOND);
  host::set_trace_level(0);
  auto call = [](client& from, const TEE_UUID& other) {
    for (int calls = 0; calls < 2000; calls++) {
      std::string identity;
      TEEC_Result res = relay(from, {other}, &identity);
      EXPECT_TRUE(res == TEEC_SUCCESS || res == TEEC_ERROR_BUSY) << res;
    }
  };
  std::thread other([&] { call(second, echo::FIRST); });
  call(first, echo::SECOND);
  other.join();
  host::set_trace_level(TEE_TRACE_ERROR);
  for (const TEE_UUID& ta : {echo::FIRST, echo::SECOND}) {
    host::live_counts counts;
    ASSERT_TRUE(host::counts_of(ta, &counts));
    EXPECT_EQ(counts, host::live_counts{});
  }
}

}  // namespace
}  // namespace tee::test
