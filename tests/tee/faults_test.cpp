// Trusted applications that fail, hang or are asked to end, and the rules of their instances.
#include "tee_client_api.h"
#include "tee_extensions.h"

#include <chrono>
#include <future>
#include <gtest/gtest.h>
#include <thread>

#include "tests/tee/client.h"
#include "tests/tee/ta_echo/echo_ta.h"
#include "tests/tee/ta_faulty/faulty_ta.h"

namespace tee::test {
namespace {

using namespace std::chrono_literals;

constexpr TEEC_Result DEAD = TEEC_ERROR_TARGET_DEAD;
constexpr uint32_t MINUTE = 60'000;  // a wait that only a request can end in time

// A command of the faulty TA with its slot.
TEEC_Operation request(uint32_t a, uint32_t b) {
  TEEC_Operation operation{};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INPUT, TEEC_NONE, TEEC_NONE, TEEC_NONE);
  operation.params[0].value = {a, b};
  return operation;
}

class failing : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    host::set_runaway_grace(200ms);
    host::survive_faults();
  }
  void SetUp() override { host::set_trace_level(0); }
  void TearDown() override { host::set_trace_level(TEE_TRACE_ERROR); }

  static TEEC_Result run(client& from, uint32_t command, uint32_t b = 0) {
    TEEC_Operation operation = request(0, b);
    return from.invoke(command, &operation);
  }
  static uint32_t count(client& from) {
    TEEC_Operation operation{};
    operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_OUTPUT, TEEC_NONE, TEEC_NONE, TEEC_NONE);
    EXPECT_EQ(from.invoke(faulty::COUNT, &operation), TEEC_SUCCESS);
    return operation.params[0].value.a;
  }

  static host::live_counts find_counts(const TEE_UUID& ta) {
    host::live_counts counts;
    EXPECT_TRUE(host::counts_of(ta, &counts));
    return counts;
  }

  // Has `from` run the command and asks it to end once it is under way.
  static TEEC_Result run_cancelled(client& from, uint32_t command, uint32_t b = MINUTE) {
    TEEC_Operation operation = request(0, b);
    auto result = std::async(std::launch::async, [&] { return from.invoke(command, &operation); });
    while (result.wait_for(20ms) != std::future_status::ready)
      TEEC_RequestCancellation(&operation);
    return result.get();
  }

  temp_device made;
};

TEST_F(failing, one_that_fails_fails_alone_and_comes_back_fresh) {
  client bystander(made.path(), echo::FIRST);
  client user(made.path(), faulty::SHARED);
  client second(made.path(), faulty::SHARED);
  for (uint32_t command : {faulty::PANIC, faulty::STALE, faulty::NULL_ACCESS, faulty::DIVIDE,
                           faulty::RECURSE, faulty::RECURSE_CALLING}) {
    SCOPED_TRACE(command);
    EXPECT_EQ(count(user), 1u);
    EXPECT_EQ(count(second), 2u);
    ASSERT_EQ(run(user, faulty::HOLD), TEEC_SUCCESS);
    const auto held = find_counts(faulty::SHARED);
    EXPECT_EQ(held, (host::live_counts{100, 1, 1, 1, 1}));

    EXPECT_EQ(run(user, command, TEE_ERROR_BAD_PARAMETERS), DEAD);
    for (client* each : {&user, &second}) {
      EXPECT_EQ(run(*each, faulty::COUNT), DEAD);
      EXPECT_EQ(each->origin, uint32_t{TEEC_ORIGIN_TEE});
    }
    EXPECT_EQ(bystander.invoke(echo::LEAK, nullptr), TEEC_SUCCESS);
    EXPECT_EQ(user.open_session(faulty::SHARED), TEEC_SUCCESS);
    EXPECT_EQ(find_counts(faulty::SHARED), host::live_counts{});
    EXPECT_EQ(second.open_session(faulty::SHARED), TEEC_SUCCESS);
  }
}

TEST_F(failing, at_every_entry_point) {
  client user(made.path(), faulty::SHARED);
  TEEC_Operation dies = request(faulty::PANIC, 0);
  EXPECT_EQ(user.open_session(faulty::SHARED, &dies), DEAD);
  EXPECT_EQ(user.origin, uint32_t{TEEC_ORIGIN_TEE});
  TEEC_Operation marked = request(faulty::PANIC_AT_CLOSE, 0);
  client second(made.path(), faulty::SHARED);
  ASSERT_EQ(user.open_session(faulty::SHARED, &marked), TEEC_SUCCESS);
  user.close_session();
  EXPECT_EQ(run(second, faulty::COUNT), DEAD);
  // Between trusted applications; the caller lives.
  ASSERT_EQ(user.open_session(faulty::SHARED), TEEC_SUCCESS);
  EXPECT_EQ(run(user, faulty::CALL_OTHER, faulty::PANIC), DEAD);
  EXPECT_EQ(user.origin, uint32_t{TEEC_ORIGIN_TRUSTED_APP});
  EXPECT_EQ(run(user, faulty::CALL_OTHER, faulty::DIVIDE), DEAD);
  EXPECT_EQ(count(user), 1u);
}

TEST_F(failing, requests_to_end_reach_who_listens_and_stop_who_runs_away) {
  client user(made.path(), faulty::SHARED);
  for (auto [command, result] : {std::pair{faulty::WAIT, TEEC_ERROR_CANCEL},
                                 {faulty::POLL, TEEC_ERROR_CANCEL},
                                 {faulty::WAIT_MASKED, DEAD},
                                 {faulty::LOOP, DEAD},
                                 {faulty::LOOP_CALLING, DEAD}}) {
    EXPECT_EQ(run_cancelled(user, command), result) << command;
    ASSERT_EQ(user.open_session(faulty::SHARED), TEEC_SUCCESS);
  }
  EXPECT_EQ(run(user, faulty::WAIT, 1), TEEC_SUCCESS);
  EXPECT_EQ(run_cancelled(user, faulty::WAIT_MASKED, 100), TEEC_SUCCESS);
  // Calls between trusted applications end with their time.
  EXPECT_EQ(run(user, faulty::CALL_OTHER, faulty::POLL), TEEC_ERROR_CANCEL);
  EXPECT_EQ(run(user, faulty::CALL_OTHER, faulty::LOOP), DEAD);
}

TEST_F(failing, clients_can_leave_one_that_hangs) {
  client hanging(made.path(), faulty::SHARED);
  client waiting(made.path(), faulty::SHARED);
  client leaving(made.path(), faulty::SHARED);
  TEEC_Operation endless = request(0, MINUTE);
  auto held =
      std::async(std::launch::async, [&] { return hanging.invoke(faulty::WAIT, &endless); });
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(run_cancelled(waiting, faulty::COUNT), TEEC_ERROR_CANCEL);
  EXPECT_EQ(waiting.origin, uint32_t{TEEC_ORIGIN_TEE});
  leaving.close_session();
  client other(made.path(), faulty::OTHER);
  EXPECT_EQ(count(other), 1u);
  TEEC_RequestCancellation(&endless);
  EXPECT_EQ(held.get(), TEEC_ERROR_CANCEL);
  EXPECT_EQ(count(waiting), 1u);
}

TEST_F(failing, instances_are_shared_and_live_as_declared) {
  const struct {
    TEE_UUID ta;
    TEEC_Result second;  // session, beside an open one
    uint32_t its_count;
    uint32_t afterwards;  // count of a session when all others are closed
  } rules[] = {{faulty::SHARED, TEEC_SUCCESS, 2, 3},
               {faulty::SEPARATE, TEEC_SUCCESS, 1, 1},
               {faulty::EXCLUSIVE, TEEC_ERROR_BUSY, 0, 2},
               {faulty::PASSING, TEEC_SUCCESS, 2, 1}};
  client second(made.path(), echo::FIRST);
  for (const auto& rule : rules) {
    client first(made.path(), rule.ta);
    EXPECT_EQ(count(first), 1u);
    EXPECT_EQ(second.open_session(rule.ta), rule.second);
    if (rule.its_count != 0) {
      EXPECT_EQ(count(second), rule.its_count);
    }
    first.close_session();
    second.close_session();
    EXPECT_EQ(second.open_session(rule.ta), TEEC_SUCCESS);
    EXPECT_EQ(count(second), rule.afterwards);
  }
  // One dies, the other one of the same kind does not.
  client first(made.path(), faulty::SEPARATE);
  ASSERT_EQ(second.open_session(faulty::SEPARATE), TEEC_SUCCESS);
  EXPECT_EQ(run(first, faulty::PANIC), DEAD);
  EXPECT_EQ(count(second), 1u);
}

}  // namespace
}  // namespace tee::test
