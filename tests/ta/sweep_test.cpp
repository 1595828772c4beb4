// Every command's good request, swept: every platform call of it fails once, its input ends at
// every byte and has a bit of every byte changed, its output has every size. The harness looks
// after each command that nothing stays alive.
#include <functional>
#include <gtest/gtest.h>

#include "support/sets.h"
#include "support/ta_under_test.h"
#include "ta/pkey.h"
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
  std::string name;
  std::function<request()> make;  // begins an operation first where the command wants one
  left_behind on_failure = {false, std::nullopt};
  size_t enough = SIZE_MAX;     // so many bytes of input suffice; as a rule all
  bool output_is_fixed = true;  // in its length, whatever was drawn
};

// A key and one whole use of it.
struct good_use {
  const char* name;
  bytes blob;
  uint32_t purpose;
  param_set begin;
  bytes data = bytes(40, 0x77);
  param_set update = {};
  bytes last = {};  // what finish is given
};

param_set key_of(uint32_t algorithm, uint32_t bits, const param_set& more) {
  param_set key = one(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_KEY_SIZE, bits).append(more);
  for (uint32_t purpose = KM_PURPOSE_ENCRYPT; purpose <= KM_PURPOSE_VERIFY; purpose++)
    key.add(KM_TAG_PURPOSE, purpose);
  return key.add_flag(KM_TAG_NO_AUTH_REQUIRED);
}

param_set rsa_use(scheme how) {
  return one(KM_TAG_PADDING, how.padding).add(KM_TAG_DIGEST, how.digest);
}

constexpr scheme PKCS1_SHA1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1};
constexpr scheme EC_SHA1 = {0, KM_DIGEST_SHA1};

class Sweep : public testing::Test {
 protected:
  Sweep() {
    ta.watch_secret(rsa.number(OSSL_PKEY_PARAM_RSA_D));
    ta.watch_secret(rsa.number(OSSL_PKEY_PARAM_RSA_FACTOR1));
    ta.watch_secret(ec.number(OSSL_PKEY_PARAM_PRIV_KEY));
    ta.watch_secret(bytes(16, 0xAE));
    add_key_commands();
    const bytes rsa_blob = ta.import(rsa_key, rsa.import_data());
    const bytes ec_blob = ta.import(ec_key, ec.import_data());
    const bytes aes_blob = ta.import(aes_key, bytes(16, 0xAE));
    const auto padded = aes_use(KM_MODE_CBC, KM_PAD_PKCS7);
    const bytes sealed =
        ta.run(KM_PURPOSE_ENCRYPT, aes_blob, aes_use(KM_MODE_ECB, KM_PAD_PKCS7), bytes(40, 0x77));
    const auto associated = param_set().add_bytes(KM_TAG_ASSOCIATED_DATA, as_bytes("aad"));
    const bytes block(64, 1);
    const good_use uses[] = {
        {"HMAC sign", blob, KM_PURPOSE_SIGN, use},
        {"AES GCM", aes_blob, KM_PURPOSE_ENCRYPT,
         aes_use(KM_MODE_GCM, KM_PAD_NONE).add(KM_TAG_MAC_LENGTH, 128), bytes(40), associated},
        {"AES CBC", aes_blob, KM_PURPOSE_ENCRYPT, padded},
        {"AES ECB decrypt", aes_blob, KM_PURPOSE_DECRYPT, aes_use(KM_MODE_ECB, KM_PAD_PKCS7),
         sealed},
        {"RSA PSS", rsa_blob, KM_PURPOSE_SIGN, rsa_use({KM_PAD_RSA_PSS, KM_DIGEST_SHA1})},
        {"RSA raw sign", rsa_blob, KM_PURPOSE_SIGN, rsa_use({KM_PAD_NONE, KM_DIGEST_NONE})},
        {"RSA verify",
         rsa_blob,
         KM_PURPOSE_VERIFY,
         rsa_use(PKCS1_SHA1),
         block,
         {},
         rsa.sign(PKCS1_SHA1, block)},
        {"RSA verify, no digest",
         rsa_blob,
         KM_PURPOSE_VERIFY,
         rsa_use({KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE}),
         bytes(8),
         {},
         rsa.sign({KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE}, bytes(8))},
        {"RSA encrypt", rsa_blob, KM_PURPOSE_ENCRYPT,
         rsa_use({KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_DIGEST_NONE})},
        {"RSA raw decrypt", rsa_blob, KM_PURPOSE_DECRYPT, rsa_use({KM_PAD_NONE, KM_DIGEST_NONE})},
        {"EC sign", ec_blob, KM_PURPOSE_SIGN, one(KM_TAG_DIGEST, KM_DIGEST_SHA1)},
        {"EC raw sign", ec_blob, KM_PURPOSE_SIGN, one(KM_TAG_DIGEST, KM_DIGEST_NONE)},
        {"EC verify",
         ec_blob,
         KM_PURPOSE_VERIFY,
         one(KM_TAG_DIGEST, KM_DIGEST_SHA1),
         block,
         {},
         ec.sign(EC_SHA1, block)},
    };
    for (const good_use& row : uses)
      add_use(row);
    for (const auto& [name, its_blob] : {std::pair("RSA", rsa_blob), {"EC", ec_blob}}) {
      const std::string of = std::string(", ") + name;
      add("export_key" + of, [=] { return key_request(command::EXPORT_KEY, its_blob); });
      add("attest_key" + of, [=] { return attest_request(its_blob, challenge()); });
    }
  }

  static param_set challenge() {
    return param_set().add_bytes(KM_TAG_ATTESTATION_CHALLENGE, as_bytes("challenge"));
  }
  static param_set aes_use(uint32_t mode, uint32_t padding) {
    return one(KM_TAG_BLOCK_MODE, mode).add(KM_TAG_PADDING, padding);
  }

  void add(const std::string& name, std::function<request()> make, left_behind on_failure = {},
           size_t enough = SIZE_MAX) {
    good.push_back({name, std::move(make), on_failure, enough});
  }

  void add_key_commands() {
    add("configure", [] {
      return configure_request(
          one(KM_TAG_OS_VERSION, OS_VERSION).add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL));
    });
    for (const param_set& made : {key, aes_key, rsa_key, ec_key}) {
      const std::string of = ", algorithm " + std::to_string(*made.number(KM_TAG_ALGORITHM));
      add("generate_key" + of, [=] { return generate_request(made); }, {false, 0});
      // The numbers of an RSA key are as long as they are.
      good.back().output_is_fixed = made.number(KM_TAG_ALGORITHM) != KM_ALGORITHM_RSA;
    }
    const std::tuple<const char*, param_set, bytes> imports[] = {
        {"import_key, HMAC", key, bytes(20, 0x0b)},
        {"import_key, AES", aes_key, bytes(16, 0xAE)},
        {"import_key, RSA", rsa_key, rsa.import_data()},
        {"import_key, EC", ec_key, ec.import_data()}};
    for (const auto& [name, made, data] : imports)
      add(name, [made = made, data = data] { return import_request(made, data); }, {true, 0});
    add("get_key_character_size",
        [&] { return key_request(command::GET_KEY_CHARACTER_SIZE, blob, app, 0); });
    add("get_key_character", [&] { return key_request(command::GET_KEY_CHARACTER, blob, app); });
    add("upgrade_key", [&] { return upgrade_request(blob, binding); }, {true, UNTOUCHED});
    add("_abort", [&] { return abort_request(ta.begun(KM_PURPOSE_SIGN, blob, use)); });
    add(
        "delete_key", [&] { return request{.id = 21, .input = blob}; }, {}, 2);
    add("delete_all_key", [] { return request{.id = 22}; });
  }

  void add_use(const good_use& row) {
    const std::string of = std::string(", ") + row.name;
    add("begin" + of, [=] { return begin_request(row.purpose, row.blob, row.begin); });
    add("update" + of, [=, this] {
      const uint32_t handle = ta.begun(row.purpose, row.blob, row.begin);
      return step_request(command::UPDATE, handle, row.data, row.update);
    });
    add("finish" + of, [=, this] {
      const uint32_t handle = ta.begun(row.purpose, row.blob, row.begin);
      EXPECT_TRUE(succeeded(ta.update(handle, row.data, row.update))) << row.name;
      return step_request(command::FINISH, handle, row.last);
    });
    good.back().output_is_fixed = of.find("EC") == std::string::npos;
  }

  // Whatever it was that was begun or fed is not needed any more.
  reply send(const request& what) {
    const reply answer = ta.send(what);
    errors = ta.trace().errors();
    if (what.id == 16 && answer.ok()) ta.abort(answer.b);
    if (what.id == 17 && answer.ok()) ta.abort(what.a);
    return answer;
  }

  ta_under_test ta;
  std::string errors;
  std::vector<good_request> good;
  const pkey rsa = pkey::rsa(512);
  const pkey ec = pkey::ec(521);
  const client::application app = {{'i', 'd'}, {'d', 'a', 't', 'a'}};
  const param_set binding = param_set()
                                .add_bytes(KM_TAG_APPLICATION_ID, app.id)
                                .add_bytes(KM_TAG_APPLICATION_DATA, app.data);
  const param_set key = hmac_key(160).append(binding);
  const param_set use = mac_use().append(binding);
  const param_set aes_key =
      key_of(KM_ALGORITHM_AES, 128,
             several(KM_TAG_BLOCK_MODE, {KM_MODE_GCM, KM_MODE_CBC, KM_MODE_ECB})
                 .append(several(KM_TAG_PADDING, {KM_PAD_NONE, KM_PAD_PKCS7}))
                 .add(KM_TAG_MIN_MAC_LENGTH, 128));
  const param_set rsa_key = key_of(
      KM_ALGORITHM_RSA, 512,
      several(KM_TAG_DIGEST, {KM_DIGEST_NONE, KM_DIGEST_SHA1})
          .append(several(KM_TAG_PADDING, {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN,
                                           KM_PAD_RSA_PKCS1_1_5_ENCRYPT}))
          .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537));
  const param_set ec_key =
      key_of(KM_ALGORITHM_EC, 521, several(KM_TAG_DIGEST, {KM_DIGEST_NONE, KM_DIGEST_SHA1}));
  const bytes blob = ta.generate(key);
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

// Of the middle of long inputs, which is a blob or a number, one byte in seven is enough.
bool is_swept(size_t at, size_t size) {
  return at < 8 || size - at < 150 || at % 7 == 0;
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
      if (!is_swept(size, sample.input.size())) continue;
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
    // A changed size may be that of a key which takes minutes to make.
    if (row.name == "generate_key, algorithm " + std::to_string(KM_ALGORITHM_RSA)) continue;
    for (size_t i = 0; i < sample.input.size(); i++) {
      if (!is_swept(i, sample.input.size())) continue;
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
    if (sample.capacity == 0 || needed == 0 || !row.output_is_fixed) continue;
    // What takes a long time to make is made for every 61st size, and for all near both ends.
    const size_t stride = needed > 1000 ? 61 : 1;
    for (size_t capacity = 0; capacity <= needed + 1; capacity++) {
      if (capacity > 5 && capacity + 5 < needed && capacity % stride != 0) continue;
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
