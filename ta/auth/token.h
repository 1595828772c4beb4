// Authentication tokens: how the authenticators of the device (password, fingerprint) tell that a
// user was there. They sign their tokens under the boot seed, so a token is good for one boot.
#pragma once

#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <span>

#include "ta/base/bytes.h"
#include "ta/params/param_set.h"

namespace keymaster {

constexpr size_t AUTH_TOKEN_SIZE = 69;
constexpr size_t AUTH_TOKEN_MAC_SIZE = 32;

// auth_token_t: a token as it travels, 69 bytes without padding. The two last numbers are
// big-endian, the others little-endian.
struct __attribute__((packed)) auth_token_t {
  uint8_t version;                   // 0
  uint64_t challenge;                // handle of the operation that the token is for
  uint64_t user_id;                  // secure user identifier
  uint64_t authenticator_id;         // identifier of the authenticator's enrolment
  uint32_t authenticator_type;       // big-endian; bit mask of KM_AUTH_TYPE_*
  uint64_t timestamp;                // big-endian; ms
  uint8_t mac[AUTH_TOKEN_MAC_SIZE];  // HMAC-SHA256 over all bytes before it
};
static_assert(sizeof(auth_token_t) == AUTH_TOKEN_SIZE);
static_assert(offsetof(auth_token_t, authenticator_id) == 17);
static_assert(offsetof(auth_token_t, authenticator_type) == 25);
static_assert(offsetof(auth_token_t, timestamp) == 29);
static_assert(offsetof(auth_token_t, mac) == 37);

// auth_tokens_init: makes the token key from the boot seed, and an empty token cache; what an
// earlier instance in this process left is forgotten, not freed. The platform's code or
// TEE_ERROR_OUT_OF_MEMORY; nothing stays allocated then.
[[nodiscard]] TEE_Result auth_tokens_init();

// auth_tokens_destroy: frees key and cache.
void auth_tokens_destroy();

// check_auth_token_valid: whether `token` has the size and version of a token and a MAC made under
// this boot's key. A MAC that cannot be computed makes it invalid.
[[nodiscard]] bool check_auth_token_valid(byte_view token);

// ComputeSignature: HMAC-SHA256 (RFC 2104) of `data` under `key` into `out`. False, with `out` all
// zeros, when the platform fails.
[[nodiscard]] bool ComputeSignature(std::span<uint8_t, AUTH_TOKEN_MAC_SIZE> out,
                                    TEE_ObjectHandle key, byte_view data);

// check_auth: whether the user `secure_id` is authenticated for a key with this KM_TAG_AUTH_TIMEOUT
// (null when it has none) and these KM_TAG_USER_AUTH_TYPE bits. `token` is a valid token, or empty
// when the request has none: then only a cached token that is younger than the timeout would do. A
// challenge of 0 accepts any.
[[nodiscard]] bool check_auth(uint64_t secure_id, uint64_t challenge, byte_view token,
                              const keymaster_key_param_t* auth_timeout, uint32_t auth_type);

// cache_auth_token: stores a valid token in the first free entry of the cache, unless an entry
// holds it. The entry is not marked as holding it.
void cache_auth_token(byte_view token);

}  // namespace keymaster
