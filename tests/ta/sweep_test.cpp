// Every command's good request, swept: every platform call of it fails once, its input ends at
// every byte and has a bit of every byte changed, its output has every size. The harness looks
// after each command that nothing stays alive.
#include "ta/pkey.h"
#include "tee/device/object_store.h"

namespace keymaster::test {
namespace {

using client::as_bytes;
using namespace std::string_literals;

constexpr TEE_Result FAULT = TEE_ERROR_OUT_OF_MEMORY;

struct good_request {
  std::string name;
  std::function<request()> make;  // begins an operation first where the command wants one
  bool output_is_fixed = true;    // in its length, whatever was drawn
};

bool is(command id, const request& what) {
  return what.id == static_cast<uint32_t>(id);
}

// A key and one whole use of it.
struct good_use {
  std::string name;
  bytes blob;
  uint32_t purpose;
  param_set begin;
  bytes data = bytes(40, 0x77);
  bytes last = {};  // what finish is given
  param_set update = {};
};

constexpr scheme RAW = {KM_PAD_NONE, KM_DIGEST_NONE};
constexpr scheme PKCS1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE};
constexpr scheme PKCS1_SHA1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1};
constexpr scheme EC_SHA1 = {0, KM_DIGEST_SHA1};

param_set aes_use(uint32_t mode, uint32_t padding) {
  return one(KM_TAG_BLOCK_MODE, mode).add(KM_TAG_PADDING, padding);
}

class Sweep : public testing::Test {
 protected:
  Sweep() {
    ta.watch_secret(rsa.number(OSSL_PKEY_PARAM_RSA_D));
    ta.watch_secret(rsa.number(OSSL_PKEY_PARAM_RSA_FACTOR1));
    ta.watch_secret(ec.number(OSSL_PKEY_PARAM_PRIV_KEY));
    ta.watch_secret(bytes(16, 0xAE));
    add_key_commands();
    const bytes hmac_blob = add_key("HMAC", key, bytes(20, 0x0b));
    const bytes aes_blob =
        add_key("AES", with(any_use(KM_ALGORITHM_AES), KM_TAG_KEY_SIZE, {128}), bytes(16, 0xAE));
    const bytes rsa_blob = add_key("RSA",
                                   with(any_use(KM_ALGORITHM_RSA), KM_TAG_KEY_SIZE, {512})
                                       .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537),
                                   rsa.import_data());
    const bytes ec_blob =
        add_key("EC", with(any_use(KM_ALGORITHM_EC), KM_TAG_KEY_SIZE, {521}), ec.import_data());
    for (const auto& [name, its_blob] : {std::pair("RSA"s, rsa_blob), {"EC"s, ec_blob}}) {
      add("export_key, " + name, [=] { return key_request(command::EXPORT_KEY, its_blob); });
      add("attest_key, " + name, [=, this] { return attest_request(its_blob, challenge); });
    }

    const param_set gcm = aes_use(KM_MODE_GCM, KM_PAD_NONE).add(KM_TAG_MAC_LENGTH, 128);
    const param_set padded = aes_use(KM_MODE_ECB, KM_PAD_PKCS7);
    const bytes sealed = ta.run(ENCRYPT, aes_blob, padded, bytes(40, 0x77));
    const param_set aad = param_set().add_bytes(KM_TAG_ASSOCIATED_DATA, as_bytes("aad"));
    const bytes block(64, 1);
    const good_use uses[] = {
        {"HMAC sign", hmac_blob, SIGN, use_hmac},
        {"AES GCM", aes_blob, ENCRYPT, gcm, bytes(40), {}, aad},
        {"AES CBC", aes_blob, ENCRYPT, aes_use(KM_MODE_CBC, KM_PAD_PKCS7)},
        {"AES ECB decrypt", aes_blob, DECRYPT, padded, sealed},
        {"RSA PSS", rsa_blob, SIGN, use({KM_PAD_RSA_PSS, KM_DIGEST_SHA1})},
        {"RSA raw sign", rsa_blob, SIGN, use(RAW)},
        {"RSA verify", rsa_blob, VERIFY, use(PKCS1_SHA1), block, rsa.sign(PKCS1_SHA1, block)},
        {"RSA verify, no digest", rsa_blob, VERIFY, use(PKCS1), {8}, rsa.sign(PKCS1, bytes{8})},
        {"RSA encrypt", rsa_blob, ENCRYPT, use({KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_DIGEST_NONE})},
        {"RSA raw decrypt", rsa_blob, DECRYPT, use(RAW)},
        {"EC sign", ec_blob, SIGN, use(EC_SHA1)},
        {"EC raw sign", ec_blob, SIGN, use({0, KM_DIGEST_NONE})},
        {"EC verify", ec_blob, VERIFY, use(EC_SHA1), block, ec.sign(EC_SHA1, block)},
    };
    for (const good_use& row : uses)
      add_use(row);
  }

  void add(const std::string& name, std::function<request()> make) {
    good.push_back({name, std::move(make)});
  }

  // Adds the making of a key in both ways, and returns the blob of the one with this data.
  bytes add_key(const std::string& name, const param_set& made, const bytes& data) {
    add("import_key, " + name, [=] { return import_request(made, data); });
    add("generate_key, " + name, [=] { return generate_request(made); });
    good.back().output_is_fixed = name != "RSA";  // its numbers are as long as they are
    return ta.import(made, data);
  }

  void add_key_commands() {
    add("configure", [] {
      return configure_request(
          one(KM_TAG_OS_VERSION, OS_VERSION).add(KM_TAG_OS_PATCHLEVEL, OS_PATCHLEVEL));
    });
    add("get_key_character_size",
        [&] { return key_request(command::GET_KEY_CHARACTER_SIZE, blob, app, 0); });
    add("get_key_character", [&] { return key_request(command::GET_KEY_CHARACTER, blob, app); });
    add("upgrade_key", [&] { return upgrade_request(blob, binding); });
    add("_abort", [&] { return abort_request(ta.begun(SIGN, blob, use_hmac)); });
    add("delete_key", [&] { return request{.id = 21, .input = blob}; });
    add("delete_all_key", [] { return request{.id = 22}; });
  }

  void add_use(const good_use& row) {
    add("begin, " + row.name, [=] { return begin_request(row.purpose, row.blob, row.begin); });
    add("update, " + row.name, [=, this] {
      const uint32_t handle = ta.begun(row.purpose, row.blob, row.begin);
      return step_request(command::UPDATE, handle, row.data, row.update);
    });
    add("finish, " + row.name, [=, this] {
      const uint32_t handle = ta.begun(row.purpose, row.blob, row.begin);
      EXPECT_TRUE(succeeded(ta.update(handle, row.data, row.update))) << row.name;
      return step_request(command::FINISH, handle, row.last);
    });
    good.back().output_is_fixed = !row.name.starts_with("EC");
  }

  reply send(const request& what) {
    const reply answer = ta.send(what);
    abandon(what, answer);
    return answer;
  }
  // Whatever it was that was begun or fed is not needed any more.
  void abandon(const request& what, const reply& answer) {
    if (is(command::BEGIN, what) && answer.ok()) ta.abort(answer.b);
    if (is(command::UPDATE, what) && answer.ok()) ta.abort(what.a);
  }

  ta_under_test ta;
  std::vector<good_request> good;
  const pkey rsa = pkey::rsa(512);
  const pkey ec = pkey::ec(521);
  const client::application app = {{'i', 'd'}, {'d', 'a', 't', 'a'}};
  const param_set binding = bound_to("id", "data");
  const param_set key = hmac_key(160).append(binding);
  const param_set use_hmac = mac_use().append(binding);
  const param_set challenge =
      param_set().add_bytes(KM_TAG_ATTESTATION_CHALLENGE, as_bytes("challenge"));
  const bytes blob = ta.generate(key);
};

// Of the middle of long inputs, which is a blob or a number, one byte in seven is enough.
bool is_swept(size_t at, size_t size) {
  return at < 8 || size - at < 150 || at % 7 == 0;
}

// What a lack of memory is answered with, by the first of these that is traced; what is not here
// hands the code of the platform on or says that memory or something unknown was missing.
constexpr struct {
  const char* trace;
  TEEC_Result res;
  int32_t km_error;
} ANSWERS[] = {
    {"update: Unmarshal failed", TEEC_SUCCESS, -38},
    {"ec_verify_finish: Decode signature failed", TEEC_SUCCESS, -30},
    {"upgrade_key: Open V1 key failed", TEEC_ERROR_ITEM_NOT_FOUND, 0},
    {"open_key: ", TEEC_SUCCESS, -62},
    {": Unmarshal failed", TEEC_ERROR_BAD_PARAMETERS, 0},
    {"save_key: ", FAULT, 0},
    {"resolve_key_data: ", TEEC_SUCCESS, -1000},
};

bool is_right_answer(const reply& answer, const std::string& errors) {
  for (const auto& [trace, res, km_error] : ANSWERS) {
    if (errors.find(trace) == std::string::npos) continue;
    return answer.res == res && answer.km_error == km_error;
  }
  if (answer.res == FAULT) return answer.km_error == 0 || answer.km_error == -1000;
  return answer.res == TEEC_SUCCESS && (answer.km_error == -41 || answer.km_error == -1000);
}

TEST_F(Sweep, EveryFailedPlatformCallIsReported) {
  for (const good_request& row : good) {
    SCOPED_TRACE(row.name);
    request what;
    const auto make = [&] {
      EXPECT_TRUE(succeeded(send(row.make())));
      return what = row.make();
    };
    ta.fail_each_call(FAULT, make, [&](const reply& answer, bool fired) {
      const std::string errors = ta.trace().errors();
      EXPECT_EQ(errors.empty(), !fired);
      EXPECT_TRUE(fired ? is_right_answer(answer, errors) : answer.ok())
          << answer.res << ", " << answer.km_error << ": " << errors;
      abandon(what, answer);
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
      // What is deleted is not looked into.
      const bool done = is(command::DELETE_KEY, what) && size >= 2;
      EXPECT_EQ(send(what).ok(), done) << row.name << ", " << size << " bytes";
    }
  }
}

TEST_F(Sweep, ChangedInputsLeaveNothingBehind) {
  for (const good_request& row : good) {
    const request sample = row.make();
    EXPECT_TRUE(succeeded(send(sample))) << row.name;
    // A changed size may be that of a key which takes minutes to make.
    if (row.name == "generate_key, RSA") continue;
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
    const bool imports = is(command::IMPORT_KEY, sample);
    const bool upgrades = is(command::UPGRADE_KEY, sample);
    const bool clears = imports || is(command::GENERATE_KEY, sample);
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
      EXPECT_EQ(answer.output_size, imports || upgrades ? capacity : 0) << row.name;
      EXPECT_TRUE(!clears || answer.buffer == bytes(capacity)) << row.name;
      EXPECT_TRUE(!upgrades || answer.buffer == bytes(capacity, UNTOUCHED)) << row.name;
    }
  }
}

// Creation, on a device that has the stored key and on one that has not made it yet.
TEST(SweepCreation, EveryFailedPlatformCallIsReported) {
  ta_under_test ta({.configured = false});
  for (const bool first_start : {false, true}) {
    bool fired = true;
    for (uint64_t n = 1; fired; n++) {
      ta.restart();
      ta.stop();
      if (first_start) tee::device::open(ta.path())->objects().remove(KSK_OBJECT);
      tee::host::fail_nth_call(n, FAULT);
      const TEEC_Result res = ta.start();
      fired = tee::host::fault_fired();
      tee::host::clear_fault();
      // Without replay-protected storage the TA does without it.
      const bool tolerated = ta.trace().has("key_store_init: no RPMB for ksk");
      EXPECT_EQ(res, fired && !tolerated ? FAULT : TEEC_SUCCESS) << n;
      tee::host::live_counts counts;
      EXPECT_EQ(tee::host::counts_of(KEYMASTER_TA, &counts), res == TEEC_SUCCESS) << n;
    }
  }
}

}  // namespace
}  // namespace keymaster::test
