// The checks of a key's authorisations. They trace as authorize_begin and
// authorize_update_or_finish, whose parts they are. A key's parameters are walked once, in their
// order, and the first that refuses decides: that order is part of what clients see.
#include "ta/auth/authorization.h"

#include "ta/alg/algorithm.h"
#include "ta/auth/clock.h"
#include "ta/auth/token.h"
#include "ta/auth/use_log.h"

namespace keymaster {
namespace {

// What a key says once for all of its parameters, gathered in one walk: a key may name very many
// users, and each is checked against these. Of a repeated limit the strictest holds.
struct key_terms_t {
  bool is_without_auth = false;     // KM_TAG_NO_AUTH_REQUIRED
  bool takes_caller_nonce = false;  // KM_TAG_CALLER_NONCE
  bool has_auth_type = false;
  uint32_t auth_type = UINT32_MAX;                      // the bits that every entry has
  const keymaster_key_param_t* auth_timeout = nullptr;  // the shortest
  const keymaster_key_param_t* min_seconds = nullptr;   // the largest
};

key_terms_t read_terms(const keymaster_key_param_set_t& key_params) {
  key_terms_t terms;
  for (const keymaster_key_param_t& param : key_params) {
    const auto replaces = [&](const keymaster_key_param_t* held, bool by_larger) {
      return held == nullptr || (param.integer > held->integer) == by_larger;
    };
    if (param.tag == KM_TAG_NO_AUTH_REQUIRED) terms.is_without_auth = true;
    if (param.tag == KM_TAG_CALLER_NONCE) terms.takes_caller_nonce = true;
    if (param.tag == KM_TAG_USER_AUTH_TYPE) {
      terms.has_auth_type = true;
      terms.auth_type &= param.enumerated;
    }
    if (param.tag == KM_TAG_AUTH_TIMEOUT && replaces(terms.auth_timeout, false)) {
      terms.auth_timeout = &param;
    }
    if (param.tag == KM_TAG_MIN_SECONDS_BETWEEN_OPS && replaces(terms.min_seconds, true)) {
      terms.min_seconds = &param;
    }
  }
  return terms;
}

// The user authentication that a key demands, and what the request brings for it.
struct user_auth_t {
  uint64_t challenge;  // that the token must carry; 0: any
  byte_view token;     // the request's, valid; empty when it has none
  bool is_demanded;    // a KM_TAG_USER_SECURE_ID was met
  bool is_given;       // one of them matched

  bool is_due() const { return is_demanded && !is_given; }
};

// A padding, block mode or digest that the operation will use (0 when it takes none), and whether
// the key allows it.
struct requested_value_t {
  uint32_t value = 0;
  bool is_allowed = false;
};

// A begin under check.
struct begin_check_t {
  const keymaster_key_param_set_t& request;
  const keymaster_key_param_set_t& key_params;
  uint32_t algorithm = 0;
  uint32_t purpose = 0;
  key_terms_t terms{};
  const keymaster_key_param_t* mac_length = nullptr;  // of the request, in bits
  key_identity_t identity{};
  user_auth_t user{};
  bool is_purpose_allowed = false;
  requested_value_t padding{};
  requested_value_t block_mode{};
  requested_value_t digest{};
};

keymaster_error_t read_user_auth(const keymaster_key_param_set_t& request, uint64_t challenge,
                                 user_auth_t* user) {
  user->challenge = challenge;
  const keymaster_key_param_t* token = get_unique(request, KM_TAG_AUTH_TOKEN);
  if (token == nullptr) return KM_ERROR_OK;
  if (!check_auth_token_valid(token->blob())) return KM_ERROR_INVALID_ARGUMENT;
  user->token = token->blob();
  return KM_ERROR_OK;
}

// One KM_TAG_USER_SECURE_ID of the key. No match is no refusal: another identifier may match.
keymaster_error_t check_secure_id(uint64_t secure_id, const key_terms_t& terms, user_auth_t* user) {
  if (terms.is_without_auth) {
    return refuse(KM_ERROR_INVALID_ARGUMENT,
                  "Found KM_TAG_USER_SECURE_ID but also KM_TAG_NO_AUTH_REQUIRED");
  }
  if (!terms.has_auth_type) {
    return refuse(KM_ERROR_INVALID_ARGUMENT,
                  "Found KM_TAG_USER_SECURE_ID but no KM_TAG_USER_AUTH_TYPE");
  }
  user->is_demanded = true;
  user->is_given = user->is_given || check_auth(secure_id, user->challenge, user->token,
                                                terms.auth_timeout, terms.auth_type);
  return KM_ERROR_OK;
}

// Asks the operation which padding, block mode and digest it will use.
keymaster_error_t ask_operation(begin_check_t* check) {
  const trace_scope begin("begin");
  const algorithm_t* algorithm = find_algorithm(check->algorithm);
  if (algorithm == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_ALGORITHM, "Algorithm %d not implemented",
                  static_cast<int>(check->algorithm));
  }
  const operation_methods_t* methods = algorithm->get_operation_methods(check->purpose);
  if (methods == nullptr || methods->get_padding == nullptr || methods->get_block_mode == nullptr ||
      methods->get_digest == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_PURPOSE, "Algorithm %s purpose %d not implemented",
                  algorithm->name, static_cast<int>(check->purpose));
  }
  check->padding.is_allowed = !methods->get_padding(check->request, &check->padding.value);
  check->block_mode.is_allowed = !methods->get_block_mode(check->request, &check->block_mode.value);
  check->digest.is_allowed = !methods->get_digest(check->request, &check->digest.value);
  return KM_ERROR_OK;
}

// A request that names no MAC length passes: the algorithm decides what that means.
keymaster_error_t check_mac_length(const begin_check_t& check, uint32_t minimum_bits) {
  const bool makes_mac =
      check.algorithm == KM_ALGORITHM_HMAC ||
      (check.algorithm == KM_ALGORITHM_AES && check.block_mode.value == KM_MODE_GCM);
  const keymaster_key_param_t* bits = check.mac_length;
  if (!makes_mac || bits == nullptr || minimum_bits <= bits->integer) return KM_ERROR_OK;
  return refuse(KM_ERROR_INVALID_MAC_LENGTH, "MAC length %d below the key's minimum %d",
                static_cast<int>(bits->integer), static_cast<int>(minimum_bits));
}

keymaster_error_t check_active(uint64_t active_ms) {
  if (current_time_ms() >= active_ms) return KM_ERROR_OK;
  return refuse(KM_ERROR_KEY_NOT_YET_VALID, "Key not yet valid");
}

keymaster_error_t check_expiry(uint64_t expire_ms) {
  if (current_time_ms() <= expire_ms) return KM_ERROR_OK;
  return refuse(KM_ERROR_KEY_EXPIRED, "Key expired");
}

// Whether the purpose makes something new (which the origination date ends) rather than opening
// what was made before (which the usage date ends).
bool is_origination(uint32_t purpose) {
  return purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_SIGN;
}

// System seconds on both sides: the log holds system times, and the TA's clock has another origin.
// A distance of exactly `min_seconds` still refuses.
keymaster_error_t check_rate_limit(const key_identity_t& identity, uint32_t min_seconds) {
  TEE_Time last{};
  if (!get_last_use_time(identity, &last)) return KM_ERROR_OK;
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  if (now.seconds - last.seconds > min_seconds) return KM_ERROR_OK;
  return refuse(KM_ERROR_KEY_RATE_LIMIT_EXCEEDED, "key rate limit exceeded");
}

// One parameter of the key, as the walk comes to it.
keymaster_error_t check_param(const keymaster_key_param_t& param, begin_check_t* check) {
  switch (param.tag) {
    case KM_TAG_PURPOSE:
      check->is_purpose_allowed |= param.enumerated == check->purpose;
      return KM_ERROR_OK;
    case KM_TAG_PADDING:
      check->padding.is_allowed |= param.enumerated == check->padding.value;
      return KM_ERROR_OK;
    case KM_TAG_BLOCK_MODE:
      check->block_mode.is_allowed |= param.enumerated == check->block_mode.value;
      return KM_ERROR_OK;
    case KM_TAG_DIGEST:
      check->digest.is_allowed |= param.enumerated == check->digest.value;
      return KM_ERROR_OK;
    case KM_TAG_MIN_MAC_LENGTH:
      return check_mac_length(*check, param.integer);
    case KM_TAG_ACTIVE_DATETIME:
      return check_active(param.date_time);
    case KM_TAG_ORIGINATION_EXPIRE_DATETIME:
      return is_origination(check->purpose) ? check_expiry(param.date_time) : KM_ERROR_OK;
    case KM_TAG_USAGE_EXPIRE_DATETIME:
      return is_origination(check->purpose) ? KM_ERROR_OK : check_expiry(param.date_time);
    case KM_TAG_MIN_SECONDS_BETWEEN_OPS:
      return check_rate_limit(check->identity, param.integer);
    case KM_TAG_MAX_USES_PER_BOOT:
      // Counted here and now, though a later check may refuse: that is intended, so that no refusal
      // can be used to try a key for free.
      return check_use_count_and_add(check->identity, param.integer);
    case KM_TAG_USER_SECURE_ID:
      return check_secure_id(param.long_integer, check->terms, &check->user);
    case KM_TAG_BOOTLOADER_ONLY:
      return refuse(KM_ERROR_INVALID_KEY_BLOB, "Bootloader only key");
    default:
      return KM_ERROR_OK;
  }
}

// What the walk must have found.
keymaster_error_t check_allowed(const begin_check_t& check) {
  const struct {
    bool is_allowed;
    keymaster_error_t error;
    const char* what;
  } demands[] = {
      {check.is_purpose_allowed, KM_ERROR_INCOMPATIBLE_PURPOSE, "purpose"},
      {check.padding.is_allowed, KM_ERROR_INCOMPATIBLE_PADDING_MODE, "padding"},
      {check.block_mode.is_allowed, KM_ERROR_INCOMPATIBLE_BLOCK_MODE, "block mode"},
      {check.digest.is_allowed, KM_ERROR_INCOMPATIBLE_DIGEST, "digest"},
  };
  for (const auto& [is_allowed, error, what] : demands) {
    if (!is_allowed) return refuse(error, "No such %s in key_params", what);
  }
  return KM_ERROR_OK;
}

// Without a timeout the key is authenticated for each operation, whose handle a token can carry
// only after this begin.
keymaster_error_t check_begin_auth(const begin_check_t& check) {
  if (!check.user.is_due()) return KM_ERROR_OK;
  if (check.terms.auth_timeout != nullptr) {
    return refuse(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, "Auth token check failed");
  }
  trace(TEE_TRACE_INFO, "OP AUTH NEEDED");
  return KM_AUTHENTICATION_DUE;
}

keymaster_error_t check_caller_nonce(const begin_check_t& check) {
  if (check.purpose != KM_PURPOSE_ENCRYPT || check.terms.takes_caller_nonce ||
      !contains_tag(check.request, KM_TAG_NONCE)) {
    return KM_ERROR_OK;
  }
  return refuse(KM_ERROR_CALLER_NONCE_PROHIBITED, "Caller nonce prohibited");
}

keymaster_error_t check_begin(begin_check_t* check) {
  constexpr uint64_t ANY_CHALLENGE = 0;
  TRY(read_user_auth(check->request, ANY_CHALLENGE, &check->user));
  TRY(ask_operation(check));
  for (const keymaster_key_param_t& param : check->key_params) {
    TRY(check_param(param, check));
  }
  TRY(check_allowed(*check));
  const keymaster_error_t due = check_begin_auth(*check);
  if (due != KM_ERROR_OK && due != KM_AUTHENTICATION_DUE) return due;
  TRY(check_caller_nonce(*check));
  // A full log does not refuse: the limit then goes unenforced until a record is free.
  const keymaster_key_param_t* min_seconds = check->terms.min_seconds;
  if (min_seconds != nullptr) record_key_use(check->identity, min_seconds->integer);
  return due;
}

// What anyone can do with the public half is never restricted.
bool is_public_key_use(uint32_t algorithm, uint32_t purpose) {
  return (algorithm == KM_ALGORITHM_RSA || algorithm == KM_ALGORITHM_EC) &&
         (purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_VERIFY);
}

}  // namespace

bool check_app_id_and_app_data(const keymaster_key_param_set_t& key_params, byte_view app_id,
                               byte_view app_data) {
  const trace_scope scope;
  const struct {
    keymaster_tag_t tag;
    const char* name;
    byte_view given;
  } bindings[] = {
      {KM_TAG_APPLICATION_ID, "KM_TAG_APPLICATION_ID", app_id},
      {KM_TAG_APPLICATION_DATA, "KM_TAG_APPLICATION_DATA", app_data},
  };
  for (const auto& [tag, name, given] : bindings) {
    if (!contains_tag(key_params, tag)) continue;
    const keymaster_key_param_t* bound = get_unique(key_params, tag);
    if (bound == nullptr) {
      trace(TEE_TRACE_ERROR, "Duplicated %s", name);
      return false;
    }
    if (!equal_constant_time(bound->blob(), given)) {
      trace(TEE_TRACE_ERROR, "%s mismatch", name);
      return false;
    }
  }
  return true;
}

outcome authorize_begin(byte_view key_blob, uint32_t purpose,
                        const keymaster_key_param_set_t& begin_params,
                        const keymaster_key_param_set_t& key_params) {
  const trace_scope scope;
  const keymaster_key_param_t* algorithm = get_unique(key_params, KM_TAG_ALGORITHM);
  if (algorithm == nullptr) {
    return refuse(KM_ERROR_INVALID_KEY_BLOB, "No or too many KM_TAG_ALGORITHM in key_params");
  }
  if (is_public_key_use(algorithm->enumerated, purpose)) return DONE;
  begin_check_t check{.request = begin_params,
                      .key_params = key_params,
                      .algorithm = algorithm->enumerated,
                      .purpose = purpose,
                      .terms = read_terms(key_params),
                      .mac_length = get_unique(begin_params, KM_TAG_MAC_LENGTH)};
  TRY(identify_key(key_blob, &check.identity));
  return check_begin(&check);
}

keymaster_error_t authorize_update_or_finish(const keymaster_key_param_set_t& request_params,
                                             const keymaster_key_param_set_t& key_params,
                                             uint64_t challenge) {
  const trace_scope scope;
  const key_terms_t terms = read_terms(key_params);
  if (terms.auth_timeout != nullptr) return KM_ERROR_OK;
  user_auth_t user{};
  TRY(read_user_auth(request_params, challenge, &user));
  for (const keymaster_key_param_t& param : key_params) {
    if (param.tag == KM_TAG_USER_SECURE_ID) {
      TRY(check_secure_id(param.long_integer, terms, &user));
    }
  }
  if (!user.is_due()) return KM_ERROR_OK;
  return refuse(KM_ERROR_KEY_USER_NOT_AUTHENTICATED, "Auth token check failed");
}

}  // namespace keymaster
