// Authorisation of key use: what a begin, update and finish are refused for, tokens, the TA's
// clock.
#include "ta/auth.h"

namespace keymaster::test {
namespace {

param_set with_token(byte_view token) {
  return param_set().add_bytes(KM_TAG_AUTH_TOKEN, token);
}

param_set aes_key(uint32_t mode, const param_set& more = {}) {
  return one(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
      .add(KM_TAG_KEY_SIZE, 128)
      .add(KM_TAG_PURPOSE, ENCRYPT)
      .add(KM_TAG_BLOCK_MODE, mode)
      .add(KM_TAG_PADDING, KM_PAD_NONE)
      .append(more);
}

param_set bootloader_key(uint32_t algorithm, uint32_t bits) {
  return with(any_use(algorithm), KM_TAG_KEY_SIZE, {bits})
      .add(KM_TAG_RSA_PUBLIC_EXPONENT, 3)
      .add(KM_TAG_BOOTLOADER_ONLY, 1);
}

const param_set CBC = one(KM_TAG_BLOCK_MODE, KM_MODE_CBC);
const param_set OWN_NONCE = param_set(CBC).add_bytes(KM_TAG_NONCE, bytes(16));
constexpr char NOT_YET[] = "authorize_begin: Key not yet valid";
constexpr char EXPIRED[] = "authorize_begin: Key expired";
constexpr char BAD_VERSION[] =
    "check_auth_token_valid: Wrong auth token version, expected 0, got 1";
constexpr char BAD_MAC[] = "check_auth_token_valid: Wrong auth token MAC";
const std::string NOT_MET = "authorize_begin: Auth token check failed";

struct begin_case {
  int32_t error;       // 0: granted
  std::string reason;  // of authorize_begin, unless it names another function
  param_set key;
  param_set request = sign_request();
  uint32_t purpose = SIGN;
};

constexpr char BAD_NONCE[] = "Caller nonce prohibited";
constexpr keymaster_tag_t ACTIVE = KM_TAG_ACTIVE_DATETIME;
constexpr keymaster_tag_t ORIGINATION = KM_TAG_ORIGINATION_EXPIRE_DATETIME;
constexpr keymaster_tag_t USAGE = KM_TAG_USAGE_EXPIRE_DATETIME;

const begin_case BEGINS[] = {
    {-3, "No such purpose in key_params", verify_key()},
    {-13, "No such digest in key_params", sign_key(), mac_use(128, KM_DIGEST_SHA_2_512)},
    {0, "", sign_key(), one(KM_TAG_MAC_LENGTH, 128)},
    {-11, "No such padding in key_params", aes_key(KM_MODE_CBC),
     param_set(CBC).add(KM_TAG_PADDING, KM_PAD_PKCS7), ENCRYPT},
    {-8, "No such block mode in key_params", aes_key(KM_MODE_ECB), CBC, ENCRYPT},
    {-55, BAD_NONCE, aes_key(KM_MODE_CBC), OWN_NONCE, ENCRYPT},
    {0, "", aes_key(KM_MODE_CBC, one(KM_TAG_CALLER_NONCE, 1)), OWN_NONCE, ENCRYPT},
    {-2, "begin: Algorithm HMAC purpose 0 not implemented", signer(KM_TAG_PURPOSE, ENCRYPT),
     sign_request(), ENCRYPT},
    {-57, "MAC length 120 below the key's minimum 128", sign_key(), mac_use(120)},
    {-57, "MAC length 96 below the key's minimum 128",
     aes_key(KM_MODE_GCM, one(KM_TAG_MIN_MAC_LENGTH, 128)),
     one(KM_TAG_BLOCK_MODE, KM_MODE_GCM).add(KM_TAG_MAC_LENGTH, 96), ENCRYPT},
    {0, "", signer(ACTIVE, NOW)},
    {-24, NOT_YET, signer(ACTIVE, NOW + 1)},
    {0, "", signer(ORIGINATION, NOW)},
    {-25, EXPIRED, signer(ORIGINATION, NOW - 1)},
    {-25, EXPIRED, aes_key(KM_MODE_CBC, one(ORIGINATION, NOW - 1)), CBC, ENCRYPT},
    {0, "", aes_key(KM_MODE_CBC, one(ORIGINATION, 1).add(KM_TAG_PURPOSE, DECRYPT)), OWN_NONCE,
     DECRYPT},
    {0, "", signer(ORIGINATION, 1), sign_request(), VERIFY},
    {0, "", signer(USAGE, NOW), sign_request(), VERIFY},
    {-25, EXPIRED, signer(USAGE, NOW - 1), sign_request(), VERIFY},
    {0, "", signer(USAGE, 1)},
    // What opens again is not restricted in its nonce, nor other modes in their MAC length.
    {0, "", aes_key(KM_MODE_CBC, one(KM_TAG_PURPOSE, DECRYPT)), OWN_NONCE, DECRYPT},
    {0, "", aes_key(KM_MODE_GCM, one(KM_TAG_MIN_MAC_LENGTH, 128).append(CBC)),
     param_set(CBC).add(KM_TAG_MAC_LENGTH, 96), ENCRYPT},
    // The public half of a key is never restricted.
    {0, "", bootloader_key(KM_ALGORITHM_EC, 256), mac_use(), VERIFY},
    {-33, "Bootloader only key", bootloader_key(KM_ALGORITHM_EC, 256), mac_use(), SIGN},
    {0, "", bootloader_key(KM_ALGORITHM_RSA, 512), one(KM_TAG_PADDING, KM_PAD_NONE), ENCRYPT},
    // Of several reasons the first of the key's parameters decides.
    {-33, "Bootloader only key", signer(KM_TAG_BOOTLOADER_ONLY, 1).add(ACTIVE, NOW + 1)},
    {-24, NOT_YET, signer(ACTIVE, NOW + 1).add(KM_TAG_BOOTLOADER_ONLY, 1)},
    {-38, "Found KM_TAG_USER_SECURE_ID but also KM_TAG_NO_AUTH_REQUIRED",
     user_key(1).add(KM_TAG_NO_AUTH_REQUIRED, 1)},
    {-38, "Found KM_TAG_USER_SECURE_ID but no KM_TAG_USER_AUTH_TYPE",
     signer(KM_TAG_USER_SECURE_ID, USER)},
    {-26, NOT_MET, user_key(1).add(KM_TAG_AUTH_TIMEOUT, UINT32_MAX)},
    // To have a tag is to have it at least once, on both sides.
    {-55, BAD_NONCE, aes_key(KM_MODE_CBC), param_set(OWN_NONCE).add_bytes(KM_TAG_NONCE, bytes(16)),
     ENCRYPT},
    {0, "", aes_key(KM_MODE_CBC, several(KM_TAG_CALLER_NONCE, {1, 1})), OWN_NONCE, ENCRYPT},
    {-38, "Found KM_TAG_USER_SECURE_ID but also KM_TAG_NO_AUTH_REQUIRED",
     user_key(1).append(several(KM_TAG_NO_AUTH_REQUIRED, {1, 1}))},
    {-26, NOT_MET, user_key(1).append(several(KM_TAG_AUTH_TIMEOUT, {1, 2}))},
    {0, "", user_key(1).add(KM_TAG_USER_AUTH_TYPE, 3)},
    // Authentication is due, but a later check refuses.
    {-55, BAD_NONCE,
     aes_key(KM_MODE_CBC, one(KM_TAG_USER_SECURE_ID, USER).add(KM_TAG_USER_AUTH_TYPE, 1)),
     OWN_NONCE, ENCRYPT},
};

TEST_F(auth, begin_is_granted_or_refused_for_what_the_key_says) {
  for (const begin_case& row : BEGINS) {
    const bool is_whole = row.reason.empty() || row.reason.find(": ") != std::string::npos;
    SCOPED_TRACE("row " + std::to_string(&row - BEGINS));
    expect_begin(row.purpose, ta.generate(row.key), row.request, row.error,
                 (is_whole ? "" : "authorize_begin: ") + row.reason);
  }
}

TEST_F(auth, clock_follows_system_time_alone) {
  // The system clock's milliseconds are then the most there are, and fewer than at the start.
  for (const uint64_t turn : {749, 850}) {
    const bytes until = ta.generate(signer(KM_TAG_ORIGINATION_EXPIRE_DATETIME, NOW + turn));
    const bytes from = ta.generate(signer(KM_TAG_ACTIVE_DATETIME, NOW + turn));
    for (const uint64_t elapsed : {turn - 1, turn, turn + 1}) {
      SCOPED_TRACE(elapsed);
      tee::host::set_clocks(START_SYSTEM_MS + elapsed, NOW + 1'000'000'000);
      expect_sign(until, elapsed > turn ? -25 : 0, elapsed > turn ? EXPIRED : "");
      expect_sign(from, elapsed < turn ? -24 : 0, elapsed < turn ? NOT_YET : "");
    }
  }
}

TEST_F(auth, token_matches_at_begin) {
  const std::string other = "check_auth: User id mismatch";
  const std::string neither = other + " | " + other + " | " + NOT_MET;
  const std::string no_type = "check_auth: Auth type mismatch | " + other + " | " + NOT_MET;
  const struct {
    const char* name;
    client::token_request token;
    int32_t error = 0;
    std::string lines = "";
    uint32_t key_types = 1;
  } rows[] = {
      {"user", {.user_id = USER}},
      {"authenticator", {.user_id = 7, .authenticator_id = USER}},
      {"any challenge", {.user_id = USER, .challenge = 99}},
      {"second user", {.user_id = USER + 1}, 0, other},
      {"half the id", {.user_id = USER + (1ull << 32)}, -26, neither},
      {"one of the types", {.user_id = USER, .type = 2}, 0, "", 3},
      {"not the type", {.user_id = USER, .type = 2}, -26, no_type},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    // The shortest timeout: a token that comes with begin is not asked for its age.
    const bytes key = ta.generate(
        user_key(row.key_types).add(KM_TAG_USER_SECURE_ID, USER + 1).add(KM_TAG_AUTH_TIMEOUT, 1));
    const bytes token = ta.token(row.token);
    ta.advance(3'600'000);
    expect_sign(key, row.error, row.lines, with_token(token));
  }
  // It serves only the begin that brings it.
  const bytes key = ta.generate(user_key(1).add(KM_TAG_AUTH_TIMEOUT, UINT32_MAX));
  expect_sign(key, 0, "", with_token(ta.token({.user_id = USER})));
  expect_sign(key, -26, NOT_MET);
}

TEST_F(auth, damaged_and_foreign_tokens_are_invalid) {
  const bytes key = ta.generate(user_key(1));
  const bytes token = ta.token({.user_id = USER});
  ASSERT_EQ(token.size(), 69u);
  for (const size_t size : {0, 68, 70}) {
    bytes resized = token;
    resized.resize(size);
    expect_sign(key, -38,
                "check_auth_token_valid: Wrong auth token size, expected 69B, got " +
                    std::to_string(size) + "B",
                with_token(resized));
  }
  for (size_t i = 0; i < token.size(); i++) {
    SCOPED_TRACE(i);
    bytes flipped = token;
    flipped[i] ^= 1;
    expect_sign(key, -38, i == 0 ? BAD_VERSION : BAD_MAC, with_token(flipped));
  }
  ta.restart();
  expect_sign(key, 0, "", with_token(token));
  ta.reboot();
  expect_sign(key, -38, BAD_MAC, with_token(token));
}

// Were a MAC that cannot be computed taken for zeros, this token would be genuine.
TEST_F(auth, zero_mac_is_invalid_whatever_fails) {
  const bytes key = ta.generate(user_key(1));
  bytes token = ta.token({.user_id = USER});
  std::fill(token.end() - 32, token.end(), uint8_t{0});
  ta.fail_each_call(
      TEE_ERROR_OUT_OF_MEMORY,
      [&] { return begin_request(SIGN, key, sign_request(with_token(token))); },
      [](const reply& answer, bool) { EXPECT_FALSE(answer.ok()); });
}

TEST_F(auth, operation_wants_its_own_token_at_every_step) {
  const bytes key = ta.generate(user_key(3));
  const auto token_for = [&](uint64_t challenge) {
    return with_token(ta.token({.user_id = USER, .challenge = challenge}));
  };
  const std::string missing = "authorize_update_or_finish: Auth token check failed";
  for (const command step : {command::UPDATE, command::FINISH}) {
    const auto expect_refusal = [&](const param_set& brought, int32_t error,
                                    const std::string& lines) {
      // What came with begin is no token for this operation.
      const uint32_t handle = ta.begun(SIGN, key, sign_request(token_for(99)));
      EXPECT_TRUE(refused(ta.send(step_request(step, handle, {}, brought)), error));
      EXPECT_EQ(ta.trace().errors(), lines + (step == command::UPDATE ? " | update" : " | finish") +
                                         ": Authorization failed");
      EXPECT_TRUE(refused(ta.abort(handle), -28));
    };
    expect_refusal({}, -26, missing);
    expect_refusal(token_for(0), -26, "check_auth: Challenge mismatch | " + missing);
    expect_refusal(with_token(bytes(69)), -38, BAD_MAC);
  }
  const uint32_t handle = ta.begun(SIGN, key, sign_request());
  EXPECT_TRUE(ta.trace().has("authorize_begin: OP AUTH NEEDED"));
  EXPECT_TRUE(succeeded(ta.update(handle, bytes(5), token_for(handle))));
  EXPECT_TRUE(succeeded(ta.finish(handle, {}, token_for(handle))));
  // Unless the key has a timeout: then the token of begin is enough.
  const bytes timed = ta.generate(user_key(3).add(KM_TAG_AUTH_TIMEOUT, 1));
  EXPECT_TRUE(succeeded(ta.finish(ta.begun(SIGN, timed, sign_request(token_for(0))))));
}

TEST_F(auth, application_must_present_what_the_key_is_bound_to) {
  const param_set bound = bound_to("abc", "def");
  const param_set of_data = without(bound, KM_TAG_APPLICATION_ID);
  const param_set twice = bound_to("abc").append(bound_to("abc"));
  const std::tuple<param_set, param_set, std::string> rows[] = {
      {bound, bound, ""},
      {{}, bound, ""},
      {bound, {}, "KM_TAG_APPLICATION_ID mismatch"},
      {bound, bound_to("abd", "def"), "KM_TAG_APPLICATION_ID mismatch"},
      {bound, bound_to("ab", "def"), "KM_TAG_APPLICATION_ID mismatch"},
      {bound, bound_to("abc"), "KM_TAG_APPLICATION_DATA mismatch"},
      {bound, bound_to("abc", "defg"), "KM_TAG_APPLICATION_DATA mismatch"},
      {of_data, {}, "KM_TAG_APPLICATION_DATA mismatch"},
      {twice, twice, "Duplicated KM_TAG_APPLICATION_ID"},
  };
  // What the key is bound to, what is presented, and why that is refused, if it is.
  for (const auto& [binding, given, reason] : rows) {
    const std::string lines =
        "check_app_id_and_app_data: " + reason + " | begin: Wrong AppId or AppData";
    const bytes key = ta.generate(sign_key(binding));
    expect_sign(key, reason.empty() ? 0 : -33, reason.empty() ? "" : lines, given);
  }
}

}  // namespace
}  // namespace keymaster::test
