// The use log: what the instance remembers of keys that may be used only so often in one boot or
// only every so many seconds. 8 records, lost with the instance. All times are system times.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>

#include "ta/base/bytes.h"
#include "ta/params/tags.h"

namespace keymaster {

constexpr size_t USE_LOG_KEY_SIZE = 2048;
constexpr size_t USE_LOG_DIGEST_SIZE = 32;

// key_identity_t: what identifies a key in the log: its blob, or the SHA-256 of a blob that does
// not fit a record's key field. `key_blob` must outlive it and not change meanwhile.
struct key_identity_t {
  byte_view key_blob;
  uint8_t digest[USE_LOG_DIGEST_SIZE];  // set for long blobs only

  byte_view bytes() const {
    return key_blob.size() > USE_LOG_KEY_SIZE ? byte_view(digest) : key_blob;
  }
};

// identify_key: fills *identity for `key_blob`. Fails with the platform's code when a long blob's
// digest cannot be computed.
[[nodiscard]] TEE_Result identify_key(byte_view key_blob, key_identity_t* identity);

// use_log_init: a new, empty log; what an earlier instance in this process left is forgotten, not
// freed. False when out of memory.
[[nodiscard]] bool use_log_init();

// use_log_destroy: frees the log.
void use_log_destroy();

// check_use_count_and_add: counts one use of the key. KM_ERROR_KEY_MAX_OPS_EXCEEDED when `max_uses`
// were counted already; KM_ERROR_TOO_MANY_OPERATIONS when the key has no record and none is free.
// A key's first use is counted whatever `max_uses` is.
[[nodiscard]] keymaster_error_t check_use_count_and_add(const key_identity_t& key,
                                                        uint32_t max_uses);

// record_key_use: notes that the key is used now and may be used again after `min_seconds`. False
// when it has no record and none is free.
bool record_key_use(const key_identity_t& key, uint32_t min_seconds);

// get_last_use_time: *time receives the system time of the key's last noted use. False when the log
// has none.
[[nodiscard]] bool get_last_use_time(const key_identity_t& key, TEE_Time* time);

}  // namespace keymaster
