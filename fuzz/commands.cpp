// Streams of commands. A step is four bytes: which good request, which of the live operations, how
// much room for the output, how many changes; a change is a position (u16) and the byte to put
// there, or, at 0xFFFF, how many bytes to cut off the end. The last request is no request: an id, a
// types word and a value of their own. Whatever comes, each command leaves nothing alive but its
// operations (the harness sees to that), and in the end those can be ended.
#include <functional>
#include <set>

#include "keymaster/client/vault.h"
#include "support/sets.h"
#include "support/ta_under_test.h"
#include "ta/pkey.h"

using namespace keymaster;
using namespace keymaster::test;

namespace {

// Takes numbers off the input; zeros behind its end.
class stream {
 public:
  stream(const uint8_t* data, size_t size) : rest_(data, size) {}
  bool empty() const { return rest_.empty(); }
  uint8_t u8() {
    if (rest_.empty()) return 0;
    const uint8_t value = rest_[0];
    rest_ = rest_.subspan(1);
    return value;
  }
  uint16_t u16() {
    const unsigned low = u8();
    return static_cast<uint16_t>(low | static_cast<unsigned>(u8()) << 8);
  }

 private:
  byte_view rest_;
};

const param_set AES_KEY = one(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
                              .add(KM_TAG_KEY_SIZE, 128)
                              .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
                              .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
                              .add(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                              .add(KM_TAG_BLOCK_MODE, KM_MODE_CBC)
                              .add(KM_TAG_PADDING, KM_PAD_NONE)
                              .add(KM_TAG_PADDING, KM_PAD_PKCS7)
                              .add(KM_TAG_MIN_MAC_LENGTH, 128)
                              .add_flag(KM_TAG_CALLER_NONCE);
const param_set GCM_USE = one(KM_TAG_BLOCK_MODE, KM_MODE_GCM)
                              .add(KM_TAG_PADDING, KM_PAD_NONE)
                              .add(KM_TAG_MAC_LENGTH, 128)
                              .add_bytes(KM_TAG_NONCE, bytes(12));
const param_set CBC_USE = one(KM_TAG_BLOCK_MODE, KM_MODE_CBC)
                              .add(KM_TAG_PADDING, KM_PAD_PKCS7)
                              .add_bytes(KM_TAG_NONCE, bytes(16));
const param_set USER_KEY = hmac_key(256)
                               .add(KM_TAG_MAX_USES_PER_BOOT, 1000)
                               .add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 0)
                               .add_bytes(KM_TAG_APPLICATION_ID, client::as_bytes("id"));

const param_set RSA_KEY =
    with(any_use(KM_ALGORITHM_RSA), KM_TAG_KEY_SIZE, {512}).add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
const param_set EC_KEY = with(any_use(KM_ALGORITHM_EC), KM_TAG_KEY_SIZE, {256});
const param_set SOTER_KEY = param_set(RSA_KEY).add_flag(KM_TAG_SOTER_KEY);

param_set padded(uint32_t padding, uint32_t digest = KM_DIGEST_NONE) {
  return use({padding, digest});
}
const param_set RSA_PSS = padded(KM_PAD_RSA_PSS, KM_DIGEST_SHA1);
const param_set RSA_SIGN = padded(KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA_2_256);
const param_set EC_SHA256 = one(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
const param_set EC_RAW = one(KM_TAG_DIGEST, KM_DIGEST_NONE);
const param_set CHALLENGE =
    param_set().add_bytes(KM_TAG_ATTESTATION_CHALLENGE, client::as_bytes("challenge"));

// What the factory and a start of the system do for SOTER.
bool prepare_soter(ta_under_test* ta) {
  client::vault(client::context(ta->path()))
      .provision({.attk = client::read_rsa_numbers(pkey::rsa(1024).import_data()),
                  .fingerprint_name = "s",
                  .fingerprint_version = "2",
                  .cpu_id = "c",
                  .device_id = "0123456789abcdef",
                  .ta_data = {}});
  ta->expect_loading();
  return succeeded(ta->send({.id = 0xFF00}));
}

struct world {
  ta_under_test ta{{.trace_level = TEE_TRACE_DEBUG}};
  const bool is_soter_ready = prepare_soter(&ta);
  const bytes mac_key = ta.generate(hmac_key(256));
  const bytes cipher_key = ta.generate(AES_KEY);
  const bytes user_key = ta.generate(USER_KEY);
  const bytes rsa_key = ta.generate(RSA_KEY);
  const bytes ec_key = ta.generate(EC_KEY);
  const bytes soter_key = ta.generate(SOTER_KEY);
  const bytes data = bytes(48, 0x77);
  const bytes rsa_signature = ta.run(KM_PURPOSE_SIGN, rsa_key, RSA_SIGN, data);
  const bytes ec_signature = ta.run(KM_PURPOSE_SIGN, ec_key, EC_SHA256, data);
  std::set<uint32_t> live;

  // The good requests, for an operation where they want one.
  const client::application app = {{'i', 'd'}, {}};
  const param_set app_use = mac_use().add_bytes(KM_TAG_APPLICATION_ID, app.id);
  const param_set associated = param_set().add_bytes(KM_TAG_ASSOCIATED_DATA, data);
  const std::vector<std::function<request(uint32_t)>> good = {
      [](auto) { return configure_request(one(KM_TAG_OS_VERSION, OS_VERSION)); },
      [](auto) { return generate_request(hmac_key(256), 512); },
      [](auto) { return generate_request(AES_KEY, 512); },
      [&](auto) { return import_request(hmac_key(), data, 1024); },
      [&](auto) { return key_request(command::GET_KEY_CHARACTER_SIZE, user_key, app, 0); },
      [&](auto) { return key_request(command::GET_KEY_CHARACTER, mac_key, app, 512); },
      [&](auto) { return key_request(command::EXPORT_KEY, cipher_key, app, 512); },
      [&](auto) { return upgrade_request(mac_key, {}, 512); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, mac_key, mac_use(), 64); },
      [&](auto) { return begin_request(KM_PURPOSE_ENCRYPT, cipher_key, GCM_USE, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_DECRYPT, cipher_key, CBC_USE, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_DECRYPT, cipher_key, GCM_USE, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, user_key, app_use, 64); },
      [&](uint32_t handle) { return step_request(command::UPDATE, handle, data, {}, 64); },
      [&](uint32_t handle) { return step_request(command::UPDATE, handle, {}, associated, 64); },
      [&](uint32_t handle) { return step_request(command::FINISH, handle, data, {}, 128); },
      [](uint32_t handle) { return abort_request(handle); },
      [](auto) { return generate_request(EC_KEY, 2048); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, rsa_key, RSA_SIGN, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, rsa_key, RSA_PSS, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_VERIFY, rsa_key, RSA_SIGN, 64); },
      [&](auto) {
        return begin_request(KM_PURPOSE_ENCRYPT, rsa_key, padded(KM_PAD_RSA_PKCS1_1_5_ENCRYPT), 64);
      },
      [&](auto) { return begin_request(KM_PURPOSE_DECRYPT, rsa_key, padded(KM_PAD_NONE), 64); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, ec_key, EC_SHA256, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, ec_key, EC_RAW, 64); },
      [&](auto) { return begin_request(KM_PURPOSE_VERIFY, ec_key, EC_SHA256, 64); },
      [&](uint32_t handle) {
        return step_request(command::FINISH, handle, rsa_signature, {}, 128);
      },
      [&](uint32_t handle) { return step_request(command::FINISH, handle, ec_signature, {}, 128); },
      [&](uint32_t handle) { return step_request(command::FINISH, handle, {}, {}, 128); },
      [&](auto) { return key_request(command::EXPORT_KEY, rsa_key, {}, 512); },
      [&](auto) { return key_request(command::EXPORT_KEY, ec_key, {}, 512); },
      [&](auto) { return attest_request(rsa_key, CHALLENGE, 4096); },
      [&](auto) { return attest_request(ec_key, CHALLENGE, 4096); },
      [&](auto) { return begin_request(KM_PURPOSE_SIGN, soter_key, RSA_SIGN, 64); },
      [&](uint32_t handle) { return step_request(command::FINISH, handle, {}, {}, 1024); },
      [&](auto) { return key_request(command::EXPORT_KEY, soter_key, {}, 1024); },
      [](auto) { return request{.id = 0xFF01}; },
      [](auto) { return request{.id = 0xFF02, .capacity = 1024}; },
      [](auto) { return request{.id = 0xFF03, .capacity = 64}; },
  };

  request next(stream* in) const {
    const uint8_t index = in->u8();
    const uint8_t operation = in->u8();
    const uint8_t room = in->u8();
    uint8_t changes = in->u8() % 8;
    auto live_one = live.begin();
    if (!live.empty()) std::advance(live_one, operation % live.size());
    const uint32_t handle = live.empty() ? operation : *live_one;
    request what;
    if (const size_t chosen = index % (good.size() + 1); chosen < good.size()) {
      what = good[chosen](handle);
    } else {
      const uint32_t types = in->u16() & 0x7777;
      const uint32_t id = in->u8();
      what = {.id = id < 0xF0 ? id % 40 : 0xFF00 | id % 16,
              .a = in->u8(),
              .input = data,
              .capacity = 64,
              .b = in->u8()};
      if (types % 2 == 1) what.types = types;
    }
    if (room != 0 && what.capacity != 0) what.capacity = room;
    while (changes-- > 0) {
      const uint16_t position = in->u16();
      const uint8_t value = in->u8();
      if (position == 0xFFFF) {
        what.input.resize(what.input.size() - std::min<size_t>(what.input.size(), value));
      } else if (position < what.input.size()) {
        what.input[position] = value;
      }
    }
    return what;
  }

  void run(const request& what) {
    const reply answer = ta.send(what);
    const auto id = static_cast<command>(what.id);
    if (id == command::BEGIN && answer.ok()) live.insert(answer.b);
    const bool ends =
        id == command::FINISH || id == command::ABORT || (id == command::UPDATE && !answer.ok());
    if (ends && !what.types && what.b == 0) live.erase(what.a);
  }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  GTEST_FLAG_SET(break_on_failure, true);
  static world all;
  EXPECT_TRUE(all.is_soter_ready);
  all.ta.configure(OS_VERSION, OS_PATCHLEVEL);
  stream in(data, size);
  while (!in.empty())
    all.run(all.next(&in));
  for (const uint32_t handle : std::set(all.live))
    all.run(abort_request(handle));
  EXPECT_EQ(all.ta.live_operations(), 0u);
  return 0;
}
