// Every command's good request, swept: every platform call of it fails once, its input ends at
// every byte and has every bit changed, its output has every size. The harness looks after each
// command that nothing stays alive.
#include <functional>
#include <gtest/gtest.h>

#include "support/sets.h"
#include "support/ta_under_test.h"
#include "tee/device/object_store.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

constexpr TEE_Result FAULT = TEE_ERROR_OUT_OF_MEMORY;

// What a failure leaves in slot 2.
enum class on_failure { SIZE_ZERO, CLEARED_AND_SIZE_ZERO, CLEARED, UNTOUCHED_ALL };

struct good_request {
  const char* name;
  std::function<request()> make;  // begins an operation first where the command wants one
  on_failure rule = on_failure::SIZE_ZERO;
  size_t enough = SIZE_MAX;  // so many bytes of input suffice; as a rule all
};

class Sweep : public testing::Test {
 protected:
  reply send(const request& what) {
    const reply answer = ta.send(what);
    last_errors = ta.trace().errors();
    // Whatever it was that was begun is not needed.
    if (what.id == static_cast<uint32_t>(command::BEGIN) && answer.ok()) ta.abort(answer.b);
    if (what.id == static_cast<uint32_t>(command::UPDATE) && answer.ok()) ta.abort(what.a);
    return answer;
  }

  uint32_t mac_begun() { return ta.begun(KM_PURPOSE_SIGN, blob, use); }
  uint32_t cipher_begun() { return ta.begun(KM_PURPOSE_ENCRYPT, cipher_blob, cipher_use); }

  ta_under_test ta;
  std::string last_errors;
  const param_set system =
      one(KM_TAG_OS_VERSION, OS_VERSION).add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL);
  const client::application app = {{'i', 'd'}, {'d', 'a', 't', 'a'}};
  const param_set binding = param_set()
                                .add_bytes(KM_TAG_APPLICATION_ID, app.id)
                                .add_bytes(KM_TAG_APPLICATION_DATA, app.data);
  const param_set key = hmac_key(160).append(binding);
  const param_set use = mac_use().append(binding);
  const param_set cipher_key = one(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
                                   .add(KM_TAG_KEY_SIZE, 128)
                                   .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
                                   .add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                                   .add(KM_TAG_PADDING, KM_PAD_NONE)
                                   .add(KM_TAG_MIN_MAC_LENGTH, 128);
  const param_set cipher_use = one(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                                   .add(KM_TAG_PADDING, KM_PAD_NONE)
                                   .add(KM_TAG_MAC_LENGTH, 128);
  const param_set associated = param_set().add_bytes(KM_TAG_ASSOCIATED_DATA, as_bytes("aad"));
  const bytes data = bytes(40, 0x77);
  const bytes blob = ta.generate(key);
  const bytes cipher_blob = ta.generate(cipher_key);

  const std::vector<good_request> good = {
      {"configure", [&] { return configure_request(system); }},
      {"generate_key", [&] { return generate_request(key); }, on_failure::CLEARED_AND_SIZE_ZERO},
      {"generate_key, AES", [&] { return generate_request(cipher_key); },
       on_failure::CLEARED_AND_SIZE_ZERO},
      {"import_key", [&] { return import_request(key, bytes(20, 0x0b)); }, on_failure::CLEARED},
      {"get_key_character_size",
       [&] { return key_request(command::GET_KEY_CHARACTER_SIZE, blob, app, 0); }},
      {"get_key_character", [&] { return key_request(command::GET_KEY_CHARACTER, blob, app); }},
      {"upgrade_key", [&] { return upgrade_request(blob, binding); }, on_failure::UNTOUCHED_ALL},
      {"begin", [&] { return begin_request(KM_PURPOSE_SIGN, blob, use); }},
      {"begin, AES", [&] { return begin_request(KM_PURPOSE_ENCRYPT, cipher_blob, cipher_use); }},
      {"update", [&] { return step_request(command::UPDATE, mac_begun(), data); }},
      {"update, AES",
       [&] { return step_request(command::UPDATE, cipher_begun(), data, associated); }},
      {"finish", [&] { return step_request(command::FINISH, mac_begun(), data); }},
      {"finish, AES", [&] { return step_request(command::FINISH, cipher_begun(), data); }},
      {"_abort", [&] { return abort_request(mac_begun()); }},
      {"delete_key", [&] { return request{.id = 21, .input = blob}; }, on_failure::SIZE_ZERO, 2},
      {"delete_all_key", [&] { return request{.id = 22}; }},
  };
};

TEST_F(Sweep, EveryFailedPlatformCallIsReported) {
  for (const good_request& row : good) {
    bool fired = true;
    for (uint64_t n = 1; fired; n++) {
      const request what = row.make();
      tee::host::fail_nth_call(n, FAULT);
      const reply answer = ta.send(what);
      fired = tee::host::fault_fired();
      tee::host::clear_fault();
      EXPECT_EQ(answer.ok(), !fired) << row.name << ", call " << n;
      if (!fired || answer.ok()) {
        if (what.id == static_cast<uint32_t>(command::BEGIN)) ta.abort(answer.b);
        if (what.id == static_cast<uint32_t>(command::UPDATE)) ta.abort(what.a);
        continue;
      }
      EXPECT_FALSE(ta.trace().errors().empty()) << row.name << ", call " << n;
      EXPECT_TRUE(succeeded(send(row.make()))) << row.name << ", after call " << n;
    }
  }
}

TEST_F(Sweep, EveryPrefixIsRefused) {
  for (const good_request& row : good) {
    const request sample = row.make();
    EXPECT_TRUE(succeeded(send(sample))) << row.name;
    for (size_t size = 0; size < sample.input.size(); size++) {
      request what = row.make();
      what.input.resize(size);
      EXPECT_EQ(send(what).ok(), size >= row.enough) << row.name << ", " << size << " bytes";
    }
  }
}

TEST_F(Sweep, ChangedInputsLeaveNothingBehind) {
  for (const good_request& row : good) {
    const request sample = row.make();
    EXPECT_TRUE(succeeded(send(sample)));
    for (size_t i = 0; i < sample.input.size(); i++) {
      request what = row.make();
      what.input[i] = static_cast<uint8_t>(what.input[i] ^ 1 << i % 8);
      send(what);
    }
    ta.configure(OS_VERSION, OS_PATCHLEVEL);
    EXPECT_TRUE(succeeded(send(row.make()))) << row.name;
    EXPECT_EQ(ta.live_operations(), 0u) << row.name;
  }
}

void expect_left_alone(const good_request& row, const reply& answer) {
  const size_t capacity = answer.buffer.size();
  switch (row.rule) {
    case on_failure::SIZE_ZERO:
      EXPECT_EQ(answer.output_size, 0u) << row.name;
      return;
    case on_failure::CLEARED_AND_SIZE_ZERO:
      EXPECT_EQ(answer.output_size, 0u) << row.name;
      EXPECT_EQ(answer.buffer, bytes(capacity)) << row.name;
      return;
    case on_failure::CLEARED:
      EXPECT_EQ(answer.output_size, capacity) << row.name;
      EXPECT_EQ(answer.buffer, bytes(capacity)) << row.name;
      return;
    case on_failure::UNTOUCHED_ALL:
      EXPECT_EQ(answer.output_size, capacity) << row.name;
      EXPECT_EQ(answer.buffer, bytes(capacity, UNTOUCHED)) << row.name;
  }
}

TEST_F(Sweep, OutputsOfEverySizeAreRespected) {
  for (const good_request& row : good) {
    const request sample = row.make();
    const size_t needed = send(sample).output_size;
    if (sample.capacity == 0 || needed == 0) continue;
    for (size_t capacity = 0; capacity <= needed + 1; capacity++) {
      request what = row.make();
      what.capacity = capacity;
      const reply answer = send(what);
      EXPECT_EQ(answer.ok(), capacity >= needed) << row.name << ", room " << capacity;
      if (answer.ok()) {
        EXPECT_EQ(answer.output_size, needed) << row.name;
        EXPECT_TRUE(capacity == needed || answer.buffer.back() == UNTOUCHED) << row.name;
      } else {
        expect_left_alone(row, answer);
      }
    }
  }
}

// Creation, on a device that has the stored key and on one that has not made it yet.
TEST(SweepCreation, EveryFailedPlatformCallIsReported) {
  ta_under_test ta({.configured = false});
  for (const bool first_start : {false, true}) {
    bool fired = true;
    for (uint64_t n = 1; fired; n++) {
      ta.stop();
      if (first_start) {
        const auto id = std::string_view("Keymaster KSK\0", 14);
        tee::device::open(ta.path())->objects().remove(
            {TEE_STORAGE_RPMB, tee::to_bytes(KEYMASTER_TA), {id.begin(), id.end()}});
      }
      tee::host::fail_nth_call(n, FAULT);
      const TEEC_Result res = ta.start();
      fired = tee::host::fault_fired();
      tee::host::clear_fault();
      // Without replay-protected storage the TA does without it.
      const bool tolerated = ta.trace().has("key_store_init: no RPMB for ksk");
      EXPECT_EQ(res, fired && !tolerated ? FAULT : TEEC_SUCCESS) << n;
      tee::host::live_counts counts;
      EXPECT_EQ(tee::host::counts_of(KEYMASTER_TA, &counts), res == TEEC_SUCCESS) << n;
      ta.restart();
    }
  }
}

}  // namespace
}  // namespace keymaster::test
