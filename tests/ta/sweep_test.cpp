// Every command's good request, swept: every platform call of it fails once, its input ends at
// every byte and has a bit of every byte changed, its output has every size. The harness looks
// after each command that nothing stays alive.
#include <functional>
#include <gtest/gtest.h>

#include "support/sets.h"
#include "support/ta_under_test.h"
#include "tee/device/object_store.h"

namespace keymaster::test {
namespace {

using client::as_bytes;

constexpr TEE_Result FAULT = TEE_ERROR_OUT_OF_MEMORY;

// What a failure leaves in slot 2: its size as it was or 0, its bytes as they were, zeros, or any.
struct left_behind {
  bool size_kept;
  std::optional<uint8_t> content;
};

struct good_request {
  const char* name;
  std::function<request()> make;  // begins an operation first where the command wants one
  left_behind on_failure = {false, std::nullopt};
  size_t enough = SIZE_MAX;  // so many bytes of input suffice; as a rule all
};

class Sweep : public testing::Test {
 protected:
  // Whatever it was that was begun or fed is not needed any more.
  reply send(const request& what) {
    const reply answer = ta.send(what);
    errors = ta.trace().errors();
    if (what.id == 16 && answer.ok()) ta.abort(answer.b);
    if (what.id == 17 && answer.ok()) ta.abort(what.a);
    return answer;
  }

  uint32_t mac_begun() { return ta.begun(KM_PURPOSE_SIGN, blob, use); }
  uint32_t cipher_begun() { return ta.begun(KM_PURPOSE_ENCRYPT, cipher_blob, cipher_use); }

  ta_under_test ta;
  std::string errors;
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
      {"configure",
       [&] {
         return configure_request(
             one(KM_TAG_OS_VERSION, OS_VERSION).add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL));
       }},
      {"generate_key", [&] { return generate_request(key); }, {false, 0}},
      {"generate_key, AES", [&] { return generate_request(cipher_key); }, {false, 0}},
      {"import_key", [&] { return import_request(key, bytes(20, 0x0b)); }, {true, 0}},
      {"get_key_character_size",
       [&] { return key_request(command::GET_KEY_CHARACTER_SIZE, blob, app, 0); }},
      {"get_key_character", [&] { return key_request(command::GET_KEY_CHARACTER, blob, app); }},
      {"upgrade_key", [&] { return upgrade_request(blob, binding); }, {true, UNTOUCHED}},
      {"begin", [&] { return begin_request(KM_PURPOSE_SIGN, blob, use); }},
      {"begin, AES", [&] { return begin_request(KM_PURPOSE_ENCRYPT, cipher_blob, cipher_use); }},
      {"update", [&] { return step_request(command::UPDATE, mac_begun(), data); }},
      {"update, AES",
       [&] { return step_request(command::UPDATE, cipher_begun(), data, associated); }},
      {"finish", [&] { return step_request(command::FINISH, mac_begun(), data); }},
      {"finish, AES", [&] { return step_request(command::FINISH, cipher_begun(), data); }},
      {"_abort", [&] { return abort_request(mac_begun()); }},
      {"delete_key", [&] { return request{.id = 21, .input = blob}; }, {}, 2},
      {"delete_all_key", [&] { return request{.id = 22}; }},
  };
};

// Arms the n-th call from now, n = 1, 2, ..., for each turn until one comes to its end without it.
void for_each_fault(const std::function<void(uint64_t n)>& turn) {
  bool fired = true;
  for (uint64_t n = 1; fired; n++) {
    turn(n);
    fired = tee::host::fault_fired();
    tee::host::clear_fault();
  }
}

TEST_F(Sweep, EveryFailedPlatformCallIsReported) {
  for (const good_request& row : good) {
    for_each_fault([&](uint64_t n) {
      EXPECT_TRUE(succeeded(send(row.make()))) << row.name << ", before call " << n;
      const request what = row.make();
      tee::host::fail_nth_call(n, FAULT);
      const reply answer = send(what);
      EXPECT_EQ(answer.ok(), !tee::host::fault_fired()) << row.name << ", call " << n;
      EXPECT_EQ(errors.empty(), answer.ok()) << row.name << ", call " << n;
    });
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
    EXPECT_TRUE(succeeded(send(sample))) << row.name;
    for (size_t i = 0; i < sample.input.size(); i++) {
      request what = row.make();
      what.input[i] = static_cast<uint8_t>(what.input[i] ^ 1 << i % 8);
      send(what);
      EXPECT_EQ(ta.live_operations(), 0u) << row.name;
    }
    ta.configure(OS_VERSION, OS_PATCHLEVEL);
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
        continue;
      }
      EXPECT_EQ(answer.output_size, row.on_failure.size_kept ? capacity : 0) << row.name;
      const bytes content(capacity, row.on_failure.content.value_or(0));
      EXPECT_TRUE(!row.on_failure.content || answer.buffer == content) << row.name;
    }
  }
}

// Creation, on a device that has the stored key and on one that has not made it yet.
TEST(SweepCreation, EveryFailedPlatformCallIsReported) {
  ta_under_test ta({.configured = false});
  for (const bool first_start : {false, true}) {
    for_each_fault([&](uint64_t n) {
      ta.restart();
      ta.stop();
      if (first_start) tee::device::open(ta.path())->objects().remove(KSK_OBJECT);
      tee::host::fail_nth_call(n, FAULT);
      const TEEC_Result res = ta.start();
      // Without replay-protected storage the TA does without it.
      const bool tolerated = ta.trace().has("key_store_init: no RPMB for ksk");
      EXPECT_EQ(res, tee::host::fault_fired() && !tolerated ? FAULT : TEEC_SUCCESS) << n;
      tee::host::live_counts counts;
      EXPECT_EQ(tee::host::counts_of(KEYMASTER_TA, &counts), res == TEEC_SUCCESS) << n;
    });
  }
}

}  // namespace
}  // namespace keymaster::test
