// The use log.
#include "ta/auth/use_log.h"

#include <span>

#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/base/tee_handles.h"

namespace keymaster {
namespace {

constexpr size_t RECORD_COUNT = 8;

struct use_record_t {
  uint8_t key[USE_LOG_KEY_SIZE];  // the bytes of the key's identity, then zeros
  uint32_t key_length;            // of the blob, also when `key` holds its digest; 0: never used
  uint32_t use_count;             // begins counted against the key's maximum
  TEE_Time last_use;              // of a key with a rate limit; zero: none yet
  TEE_Time next_allowed;
};
static_assert(sizeof(use_record_t) == 2072);

use_record_t* records;

std::span<use_record_t> all_records() {
  return {records, RECORD_COUNT};
}

bool is_record_of(const use_record_t& record, const key_identity_t& key) {
  const byte_view bytes = key.bytes();
  return record.key_length == key.key_blob.size() &&
         equal_constant_time(byte_view(record.key).first(bytes.size()), bytes);
}

use_record_t* find_record(const key_identity_t& key) {
  for (use_record_t& record : all_records()) {
    if (is_record_of(record, key)) return &record;
  }
  return nullptr;
}

// Whether nothing is lost when another key takes the record. Uses count for the whole boot, so a
// record that counts some is never given away; a rate limit's ends with its time.
bool is_free(const use_record_t& record, uint32_t now_seconds) {
  return record.key_length == 0 ||
         (record.use_count == 0 && record.next_allowed.seconds < now_seconds);
}

// The first free record, made the key's, with no use counted and no times; null when none is free.
use_record_t* take_record(const key_identity_t& key, uint32_t now_seconds) {
  for (use_record_t& record : all_records()) {
    if (!is_free(record, now_seconds)) continue;
    wipe(object_bytes(record));
    copy_bytes(record.key, key.bytes());
    record.key_length = static_cast<uint32_t>(key.key_blob.size());
    return &record;
  }
  return nullptr;
}

}  // namespace

TEE_Result identify_key(byte_view key_blob, key_identity_t* identity) {
  const trace_scope scope;
  identity->key_blob = key_blob;
  if (key_blob.size() <= USE_LOG_KEY_SIZE) return TEE_SUCCESS;
  tee_operation sha256;
  TRY(sha256.allocate(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0));
  size_t length = 0;
  return sha256.digest_final(key_blob, identity->digest, &length);
}

bool use_log_init() {
  records = static_cast<use_record_t*>(heap_take(RECORD_COUNT * sizeof(use_record_t)));
  return records != nullptr;
}

void use_log_destroy() {
  heap_give_back(records, RECORD_COUNT * sizeof(use_record_t));
  records = nullptr;
}

keymaster_error_t check_use_count_and_add(const key_identity_t& key, uint32_t max_uses) {
  const trace_scope scope;
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  use_record_t* record = find_record(key);
  if (record != nullptr && record->use_count >= max_uses) {
    return refuse(KM_ERROR_KEY_MAX_OPS_EXCEEDED, "Key max ops exceeded");
  }
  if (record == nullptr) record = take_record(key, now.seconds);
  if (record == nullptr) return refuse(KM_ERROR_TOO_MANY_OPERATIONS, "Too many use log");
  record->use_count++;
  return KM_ERROR_OK;
}

bool record_key_use(const key_identity_t& key, uint32_t min_seconds) {
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  use_record_t* record = find_record(key);
  if (record == nullptr) record = take_record(key, now.seconds);
  if (record == nullptr) return false;
  record->last_use = record->next_allowed = now;
  // A limit beyond the clock's range stays beyond it: a sum that wrapped would free the record.
  const uint32_t until_end = UINT32_MAX - now.seconds;
  record->next_allowed.seconds += min_seconds < until_end ? min_seconds : until_end;
  return true;
}

bool get_last_use_time(const key_identity_t& key, TEE_Time* time) {
  const use_record_t* record = find_record(key);
  if (record == nullptr) return false;
  *time = record->last_use;
  // A record that so far only counts uses has no last use.
  return time->seconds != 0 || time->millis != 0;
}

}  // namespace keymaster
