// Authentication tokens.
#include "ta/auth/token.h"

#include <bit>
#include <span>

#include "ta/auth/clock.h"
#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/base/tee_handles.h"

namespace keymaster {
namespace {

static_assert(std::endian::native == std::endian::little);

constexpr size_t SIGNED_SIZE = offsetof(auth_token_t, mac);
constexpr uint8_t TOKEN_VERSION = 0;
constexpr size_t SEED_SIZE = 32;
constexpr uint32_t TOKEN_KEY_BITS = 256;

struct cache_entry_t {
  uint8_t is_free;
  uint8_t token[AUTH_TOKEN_SIZE];
};
static_assert(sizeof(cache_entry_t) == 70);
constexpr size_t CACHE_ENTRIES = 16;

TEE_ObjectHandle token_key;
cache_entry_t* token_cache;

std::span<cache_entry_t> cache() {
  return {token_cache, CACHE_ENTRIES};
}

auth_token_t parse(byte_view token) {
  auth_token_t parsed{};
  copy_bytes(object_bytes(parsed), token.first(AUTH_TOKEN_SIZE));
  return parsed;
}

bool shares_type(const auth_token_t& token, uint32_t auth_type) {
  return (__builtin_bswap32(token.authenticator_type) & auth_type) != 0;
}

TEE_Result make_token_key(tee_object* key) {
  TRY(key->allocate(TEE_TYPE_HMAC_SHA256, TOKEN_KEY_BITS));
  secret_bytes<SEED_SIZE> seed;
  TRY(checked(GetBootSeed(seed.data(), seed.size()), "GetBootSeed"));
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, seed);
  return key->populate({&secret, 1});
}

bool is_younger(const auth_token_t& token, uint32_t timeout) {
  const uint64_t age_ms = current_time_ms() - __builtin_bswap64(token.timestamp);
  // The key's timeout is taken as milliseconds, and an age that wrapped is not young.
  return age_ms <= UINT32_MAX && age_ms < timeout;
}

bool is_cached(uint64_t secure_id, uint32_t timeout, uint32_t auth_type) {
  for (const cache_entry_t& entry : cache()) {
    if (entry.is_free != 0) continue;
    const auth_token_t token = parse(entry.token);
    if (token.user_id == secure_id && shares_type(token, auth_type) && is_younger(token, timeout)) {
      return true;
    }
  }
  return false;
}

}  // namespace

TEE_Result auth_tokens_init() {
  token_key = TEE_HANDLE_NULL;
  token_cache = nullptr;
  tee_object key;
  TRY(make_token_key(&key));
  token_cache = static_cast<cache_entry_t*>(heap_take(CACHE_ENTRIES * sizeof(cache_entry_t)));
  if (token_cache == nullptr) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  for (cache_entry_t& entry : cache())
    entry.is_free = 1;
  token_key = key.release();
  return TEE_SUCCESS;
}

void auth_tokens_destroy() {
  TEE_FreeTransientObject(token_key);
  token_key = TEE_HANDLE_NULL;
  heap_give_back(token_cache, CACHE_ENTRIES * sizeof(cache_entry_t));
  token_cache = nullptr;
}

bool check_auth_token_valid(byte_view token) {
  const trace_scope scope;
  if (token.size() != AUTH_TOKEN_SIZE) {
    trace(TEE_TRACE_ERROR, "Wrong auth token size, expected %dB, got %dB",
          static_cast<int>(AUTH_TOKEN_SIZE), static_cast<int>(token.size()));
    return false;
  }
  const auth_token_t parsed = parse(token);
  if (parsed.version != TOKEN_VERSION) {
    trace(TEE_TRACE_ERROR, "Wrong auth token version, expected %d, got %d", TOKEN_VERSION,
          parsed.version);
    return false;
  }
  secret_bytes<AUTH_TOKEN_MAC_SIZE> mac;  // what a forger of this token would need
  const bool valid = ComputeSignature(mac, token_key, token.first(SIGNED_SIZE)) &&
                     equal_constant_time(mac, parsed.mac);
  if (!valid) trace(TEE_TRACE_ERROR, "Wrong auth token MAC");
  return valid;
}

bool ComputeSignature(std::span<uint8_t, AUTH_TOKEN_MAC_SIZE> out, TEE_ObjectHandle key,
                      byte_view data) {
  const trace_scope scope;
  wipe(out);
  tee_operation hmac;
  if (hmac.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, TOKEN_KEY_BITS) != TEE_SUCCESS) return false;
  if (hmac.set_key(key) != TEE_SUCCESS) return false;
  TEE_MACInit(hmac.get(), nullptr, 0);
  size_t length = 0;
  if (hmac.mac_final(data, out, &length) != TEE_SUCCESS) return false;
  if (length != out.size()) {
    trace(TEE_TRACE_ERROR, "Wrong MAC length, expected %dB, got %dB\n",
          static_cast<int>(out.size()), static_cast<int>(length));
    wipe(out);
    return false;
  }
  return true;
}

bool check_auth(uint64_t secure_id, uint64_t challenge, byte_view token,
                const keymaster_key_param_t* auth_timeout, uint32_t auth_type) {
  const trace_scope scope;
  if (token.empty()) {
    return auth_timeout != nullptr && is_cached(secure_id, auth_timeout->integer, auth_type);
  }
  cache_auth_token(token);
  const auth_token_t given = parse(token);
  const char* mismatch = nullptr;
  if (secure_id != given.user_id && secure_id != given.authenticator_id) {
    mismatch = "User id mismatch";
  } else if (!shares_type(given, auth_type)) {
    mismatch = "Auth type mismatch";
  } else if (challenge != 0 && challenge != given.challenge) {
    mismatch = "Challenge mismatch";
  }
  if (mismatch != nullptr) trace(TEE_TRACE_ERROR, "%s", mismatch);
  return mismatch == nullptr;
}

void cache_auth_token(byte_view token) {
  for (const cache_entry_t& entry : cache()) {
    if (entry.is_free == 0 && equal_constant_time(entry.token, token)) return;
  }
  for (cache_entry_t& entry : cache()) {
    if (entry.is_free == 0) continue;
    // The entry stays marked free, and that is intended: no stored token is ever found again, so a
    // key with a timeout can be used only when a token comes with begin.
    copy_bytes(entry.token, token);
    return;
  }
}

}  // namespace keymaster
