// The fingerprint that was matched last, as the fingerprint TA reports it.
#pragma once

#include "tee_internal_api.h"

#include "ta/base/bytes.h"

namespace keymaster {

// get_client_property: who calls the command that runs now.
[[nodiscard]] TEE_Result get_client_property(TEE_Identity* identity);

// is_from_fp_ta: TEE_SUCCESS when the fingerprint TA calls; TEE_ERROR_ACCESS_DENIED for anyone
// else; the platform's code when it does not tell.
[[nodiscard]] TEE_Result is_from_fp_ta();

// take_notification: stores what a notification says. It is 16 bytes, little-endian: 0 u32 version,
// which must be 0; 4 u32 fid, the matched fingerprint's identifier; 8 u64 time of the match in ms
// of TEE system time. TEE_ERROR_BAD_PARAMETERS: another length. TEE_ERROR_BAD_FORMAT: another
// version; nothing is stored.
[[nodiscard]] TEE_Result take_notification(byte_view notification);

// SOTER's own code: no fresh fingerprint.
constexpr TEE_Result SOTER_ERROR_STALE_FID = 0xFFFF3001;
constexpr uint32_t NO_FID = 0xFFFFFFFF;

// get_fid: the fingerprint of the last notification when that is at most 3000 ms old; otherwise,
// and for one that lies in the future, NO_FID and SOTER_ERROR_STALE_FID.
[[nodiscard]] TEE_Result get_fid(uint32_t* fid);

// finger_id_init: the state of a new instance, before the first notification.
void finger_id_init();

}  // namespace keymaster
