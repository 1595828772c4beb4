// A device that a process of its own serves: what lasts, who fails, what a stranger may send. The
// client API over it is in teec_test.cpp.
#include "tee_client_api.h"

#include <chrono>
#include <future>
#include <gtest/gtest.h>
#include <list>
#include <memory>
#include <span>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/tee/client.h"
#include "tests/tee/served_device.h"
#include "tests/tee/ta_echo/echo_ta.h"
#include "tests/tee/ta_faulty/faulty_ta.h"

namespace tee::test {
namespace {

using namespace std::chrono_literals;

constexpr uint32_t MINUTE = 60'000;
constexpr TEE_UUID AUTHENTICATOR = {
    0x2d8c6b71, 0xf45a, 0x4309, {0x86, 0xe2, 0x93, 0xb1, 0xd0, 0x7c, 0xa5, 0xfe}};

TEEC_Operation values(uint32_t type, uint32_t b = 0) {
  TEEC_Operation operation{};
  operation.paramTypes = type;
  operation.params[0].value = {0, b};
  return operation;
}

class service : public ::testing::Test {
 protected:
  static TEEC_Result run(client& from, uint32_t command, uint32_t b = 0) {
    TEEC_Operation operation = values(TEEC_VALUE_INPUT, b);
    return from.invoke(command, &operation);
  }
  static uint32_t count(client& from) {
    TEEC_Operation operation = values(TEEC_VALUE_OUTPUT);
    EXPECT_EQ(from.invoke(faulty::COUNT, &operation), TEEC_SUCCESS);
    return operation.params[0].value.a;
  }

  temp_device made;
  served_device device{made.path()};
};

TEST_F(service, instances_outlive_programs_and_one_that_fails_fails_alone) {
  for (uint32_t i = 1; i <= 3; i++)
    EXPECT_EQ(count(*std::make_unique<client>(device.name(), faulty::SHARED)), i);
  client bystander(device.name(), echo::FIRST);
  client user(device.name(), faulty::SHARED);
  for (uint32_t command : {faulty::PANIC, faulty::NULL_ACCESS, faulty::RECURSE}) {
    EXPECT_EQ(run(user, command), TEEC_ERROR_TARGET_DEAD);
    EXPECT_EQ(user.origin, TEEC_ORIGIN_TEE);
    EXPECT_EQ(bystander.invoke(99, nullptr), TEEC_ERROR_NOT_SUPPORTED);
    EXPECT_EQ(user.open_session(faulty::SHARED), TEEC_SUCCESS);
    EXPECT_EQ(count(user), 1u);
  }
}

TEST_F(service, one_that_is_killed_is_followed_by_the_next) {
  client user(device.name(), AUTHENTICATOR);
  device.kill();
  EXPECT_EQ(user.invoke(99, nullptr), TEEC_ERROR_TARGET_DEAD);
  EXPECT_EQ(user.origin, TEEC_ORIGIN_COMMS);
  EXPECT_EQ(user.open_session(AUTHENTICATOR), TEEC_SUCCESS);  // starts it
  EXPECT_EQ(user.invoke(99, nullptr), TEEC_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(user.origin, TEEC_ORIGIN_TRUSTED_APP);
  device.kill();
  EXPECT_EQ(user.open_session(AUTHENTICATOR), TEEC_SUCCESS);  // having found out by itself
}

TEST_F(service, of_many_that_start_at_once_one_serves) {
  device.kill();
  std::string program = TEED_PROGRAM;
  std::string path = made.path();
  std::string words[] = {"--device", "--if-unserved"};
  char* arguments[] = {program.data(), words[0].data(), path.data(), words[1].data(), nullptr};
  pid_t started[10] = {};
  for (pid_t& child : started)
    ASSERT_EQ(posix_spawn(&child, TEED_PROGRAM, nullptr, nullptr, arguments, environ), 0);
  for (pid_t child : started) {
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
  }
  const pid_t server = device.process();
  EXPECT_GT(server, 0);
  client user(made.path().insert(0, "teed:"), AUTHENTICATOR);
  EXPECT_EQ(device.process(), server);
  TEEC_Context context{};
  EXPECT_EQ(TEEC_InitializeContext(("local:" + path).c_str(), &context), TEEC_ERROR_BUSY);
}

TEST_F(service, calls_end_on_request_and_with_their_client) {
  client user(device.name(), faulty::SHARED);
  for (const auto& [command, result] :
       {std::pair{faulty::WAIT, TEEC_ERROR_CANCEL}, {faulty::POLL, TEEC_ERROR_CANCEL}}) {
    TEEC_Operation operation = values(TEEC_VALUE_INPUT, MINUTE);
    auto done = std::async(std::launch::async,
                           [&, command = command] { return user.invoke(command, &operation); });
    while (done.wait_for(20ms) != std::future_status::ready)
      TEEC_RequestCancellation(&operation);
    EXPECT_EQ(done.get(), result);
  }
  int ends[2] = {};
  ASSERT_EQ(pipe(ends), 0);
  const pid_t child = fork();
  if (child == 0) {
    client other(device.name(), faulty::SHARED);
    EXPECT_EQ(write(ends[1], "r", 1), 1);
    run(other, faulty::WAIT, MINUTE);
    _exit(0);
  }
  char byte = 0;
  ASSERT_EQ(read(ends[0], &byte, 1), 1);
  std::this_thread::sleep_for(50ms);
  ::kill(child, SIGKILL);
  waitpid(child, nullptr, 0);
  const auto begin = std::chrono::steady_clock::now();
  EXPECT_GT(count(user), 0u);  // the instance is free again
  EXPECT_LT(std::chrono::steady_clock::now() - begin, 30s);
}

TEST_F(service, a_forked_program_has_no_part_in_its_parents_context) {
  client user(device.name(), echo::FIRST);
  const pid_t child = fork();
  if (child == 0) _exit(user.invoke(99, nullptr) == TEEC_ERROR_BAD_STATE ? 0 : 1);
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(user.invoke(99, nullptr), TEEC_ERROR_NOT_SUPPORTED);
}

TEST_F(service, sessions_of_a_client_are_bounded) {
  client user(device.name(), echo::FIRST);
  std::list<TEEC_Session> open;
  TEEC_UUID uuid = to_client(echo::FIRST);
  TEEC_Result res = TEEC_SUCCESS;
  while (res == TEEC_SUCCESS && open.size() < 1000) {
    res = TEEC_OpenSession(&user.context, &open.emplace_back(), &uuid, TEEC_LOGIN_PUBLIC, nullptr,
                           nullptr, nullptr);
  }
  EXPECT_EQ(res, TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(open.size(), 256u);  // and the one of `user`
  client other(device.name(), echo::FIRST);
  EXPECT_EQ(other.invoke(99, nullptr), TEEC_ERROR_NOT_SUPPORTED);
}

// Messages as words, sent over one connection after a greeting or without.
struct message {
  bool greeted;
  std::vector<uint32_t> words;
  int descriptor;
  TEEC_Result result;  // 0xDEAD: the connection ends
};

TEST_F(service, what_is_not_of_the_protocol_is_refused) {
  constexpr TEEC_Result BAD = TEEC_ERROR_BAD_PARAMETERS;
  constexpr TEEC_Result ENDS = 0xDEAD;
  int ends[2] = {};
  ASSERT_EQ(pipe(ends), 0);
  const file_descriptor memory(os::make_shared_memory(4096));
  const auto hello = static_cast<uint32_t>(wire::request::HELLO);
  const auto share = static_cast<uint32_t>(wire::request::SHARE);
  const auto invoke = static_cast<uint32_t>(wire::request::INVOKE);
  // A call of session 9 with one parameter of that type and slot.
  auto call = [&](uint32_t types, std::vector<uint32_t> slot) {
    std::vector<uint32_t> words = {invoke, 1, 9, 1, types};
    words.insert(words.end(), slot.begin(), slot.end());
    words.resize(22);  // three empty slots, and the padding
    return words;
  };
  const message rows[] = {
      {false, {}, -1, ENDS},
      {false, {hello, 2, 0}, -1, TEEC_ERROR_NOT_SUPPORTED},
      {false, {hello, 1}, -1, TEEC_ERROR_NOT_SUPPORTED},
      {false, {hello, 1, 0, 0}, -1, TEEC_ERROR_NOT_SUPPORTED},
      {false, {static_cast<uint32_t>(wire::request::ATTACH), 1, 77}, -1, TEEC_ERROR_ACCESS_DENIED},
      {false, call(0, {}), -1, TEEC_ERROR_BAD_STATE},
      {false, std::vector<uint32_t>(wire::MESSAGE_MAX / 4 + 1, 1), -1, ENDS},
      {true, {0}, -1, TEEC_ERROR_NOT_IMPLEMENTED},
      {true, {0xFFFFFFFF}, -1, TEEC_ERROR_NOT_IMPLEMENTED},
      {true, {hello, 1, 0}, -1, TEEC_ERROR_BAD_STATE},
      {true, {invoke, 1, 9}, -1, BAD},
      {true, call(0, {}), -1, BAD},  // no such session
      {true, call(0x10000, {}), -1, BAD},
      {true, call(4, {}), -1, BAD},
      {true, call(8, {}), -1, BAD},
      {true, call(5, {0, 1}), -1, BAD},
      {true, call(5, {1, 0xFFFFFFFF}), -1, BAD},
      {true, call(6, {1, 0xFFFFFFFF}), -1, BAD},
      {true, call(6, {1, wire::INLINE_MAX + 100}), -1, BAD},
      {true, call(5, {2, 1, 5, 0}), -1, BAD},
      {true, call(5, {3, 1, 5, 0}), -1, BAD},
      {true, {share, 4096, 0}, -1, BAD},
      {true, {static_cast<uint32_t>(wire::request::RELEASE)}, -1, BAD},
      {true, {static_cast<uint32_t>(wire::request::CLOSE), 1, 1}, -1, BAD},
      {true, {share, 4096, 0}, ends[0], TEEC_ERROR_OUT_OF_MEMORY},
      {true, {share, 0, 0}, memory.get(), TEEC_ERROR_OUT_OF_MEMORY},
      {true, {share, 4097, 0}, memory.get(), TEEC_ERROR_OUT_OF_MEMORY},
      {true, {share, 4096, 0}, memory.get(), TEEC_SUCCESS},
  };
  const pid_t server = device.process();
  for (const message& row : rows) {
    SCOPED_TRACE(&row - rows);
    const file_descriptor socket = device.connect();
    std::vector<uint8_t> packet(wire::MESSAGE_MAX + 100);
    auto exchange = [&](const std::vector<uint32_t>& words, int descriptor) -> TEEC_Result {
      wire::writer to(packet);
      for (uint32_t word : words)
        to.u32(word);
      EXPECT_TRUE(wire::send(socket.get(), std::span(packet).first(to.length()), descriptor));
      const size_t got = wire::receive(socket.get(), packet);
      wire::reader from{std::span(packet).first(got)};
      return got == 0 ? ENDS : wire::read_answer(from).result;
    };
    if (row.greeted) {
      EXPECT_EQ(exchange({hello, 1, 0}, -1), TEEC_SUCCESS);
    }
    EXPECT_EQ(exchange(row.words, row.descriptor), row.result);
  }
  EXPECT_EQ(device.process(), server);
}

}  // namespace
}  // namespace tee::test
