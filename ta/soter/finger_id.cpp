// The fingerprint that was matched last.
#include "ta/soter/finger_id.h"

#include "product/uuids.h"
#include "ta/base/outcome.h"

namespace keymaster {
namespace {

constexpr TEE_UUID FINGERPRINT_TA = FINGERPRINT_TA_UUID;
constexpr uint32_t NOTIFICATION_VERSION = 0;
constexpr uint64_t FRESH_MS = 3000;

struct finger_state {
  bool is_known;  // system time begins near 0, so that a time of 0 would look fresh after boot
  uint32_t fid;
  uint64_t notify_ms;
} last_match;

uint64_t system_time_ms() {
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  return uint64_t{now.seconds} * 1000 + now.millis;
}

}  // namespace

TEE_Result get_client_property(TEE_Identity* identity) {
  wipe(object_bytes(*identity));
  return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", identity);
}

TEE_Result is_from_fp_ta() {
  const trace_scope scope;
  TEE_Identity client;
  if (TEE_Result res = get_client_property(&client)) {
    return fail(res, "get client property error, 0x%x\n", res);
  }
  const bool is_fingerprint_ta =
      client.login == TEE_LOGIN_TRUSTED_APP &&
      equal_constant_time(object_bytes(client.uuid), object_bytes(FINGERPRINT_TA));
  return is_fingerprint_ta ? TEE_SUCCESS : TEE_ERROR_ACCESS_DENIED;
}

TEE_Result take_notification(byte_view notification) {
  input_cursor in(notification);
  uint32_t version = 0;
  finger_state match{true, 0, 0};
  if (!in.read_u32(&version) || !in.read_u32(&match.fid) || !in.read_u64(&match.notify_ms) ||
      in.left() != 0) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "finger print ta input argument error");
  }
  if (version != NOTIFICATION_VERSION) {
    return fail(TEE_ERROR_BAD_FORMAT,
                "finger print ta input argument version mismatch expected %u actual %u\n",
                NOTIFICATION_VERSION, version);
  }
  last_match = match;
  return TEE_SUCCESS;
}

TEE_Result get_fid(uint32_t* fid) {
  // Unsigned: a match in the future is far in the past.
  const bool is_fresh = last_match.is_known && system_time_ms() - last_match.notify_ms <= FRESH_MS;
  *fid = is_fresh ? last_match.fid : NO_FID;
  return is_fresh ? TEE_SUCCESS : SOTER_ERROR_STALE_FID;
}

void finger_id_init() {
  last_match = {};
}

}  // namespace keymaster
