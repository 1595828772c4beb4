// Whether a key may be used: its authorisations (the characteristics in its blob) against a
// request.
#pragma once

#include <cstdint>

#include "ta/base/bytes.h"
#include "ta/base/outcome.h"
#include "ta/params/param_set.h"

namespace keymaster {

// check_app_id_and_app_data: whether the caller presents the application identifier and data that
// the key is bound to. A key that is bound to none accepts any. Empty views stand for absent ones.
[[nodiscard]] bool check_app_id_and_app_data(const keymaster_key_param_set_t& key_params,
                                             byte_view app_id, byte_view app_data);

// authorize_begin: all checks of an operation's start. `key_blob` identifies the key in the use log
// and must be the copy that `key_params` come from. DONE to proceed; KM_AUTHENTICATION_DUE to
// proceed while update and finish each ask for a token; a negative error to refuse. A use that
// counts against KM_TAG_MAX_USES_PER_BOOT is counted when the walk over the key's parameters meets
// that tag, even if a later check refuses. Fails with the platform's code only when a blob too long
// for the use log cannot be digested. Missing algorithms and purposes are traced as begin's.
outcome authorize_begin(byte_view key_blob, uint32_t purpose,
                        const keymaster_key_param_set_t& begin_params,
                        const keymaster_key_param_set_t& key_params);

// authorize_update_or_finish: the user authentication that a key without KM_TAG_AUTH_TIMEOUT asks
// for at each update and finish: a token for this very operation. `challenge` is the operation's
// handle. KM_ERROR_OK, KM_ERROR_INVALID_ARGUMENT for an invalid token or a key whose tags
// contradict each other, KM_ERROR_KEY_USER_NOT_AUTHENTICATED.
[[nodiscard]] keymaster_error_t authorize_update_or_finish(
    const keymaster_key_param_set_t& request_params, const keymaster_key_param_set_t& key_params,
    uint64_t challenge);

}  // namespace keymaster
