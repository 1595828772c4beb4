// Key blobs: the only form in which a key leaves the TA. Key material and characteristics, sealed
// with AES-256-GCM under a key derived from a key storage key and the blob's own salt:
//   0 protection (0 derived KSK, 1 RPMB KSK) | 1 salt, 64 | 65 nonce, 12 | 77 tag, 16 | 93
//   ciphertext
// The plaintext is u32 K, K bytes of key material, u32 P, P bytes of marshalled characteristics
// with every tag included. The header is not authenticated by itself: altering it alters key or
// nonce.
#pragma once

#include "ta/base/heap.h"
#include "ta/params/param_set.h"

namespace keymaster {

// save_key: seals into `blob`; *blob_size receives K + P + 101, or 0 on failure. `blob` may be
// shared memory: it is written once, when everything has succeeded, and never read.
// TEE_ERROR_SHORT_BUFFER: `blob` is too small. Otherwise a code of marshal or of the platform.
[[nodiscard]] TEE_Result save_key(byte_view key, const keymaster_key_param_set_t& characteristics,
                                  byte_span blob, size_t* blob_size);

// open_key: checks and opens a blob that lies in TA memory. On failure the outputs are empty.
// Keymaster errors: -33 too short or of unknown protection; -38 characteristics that do not
// unmarshal; -41 out of memory; -1000 the platform gave back fewer bytes. TEE codes: the platform's
// (TEE_ERROR_MAC_INVALID for anything altered), TEE_ERROR_GENERIC for inner lengths that do not
// fit, KEY_STORE_ERROR_KSK_MISSING.
outcome open_key(byte_view blob, heap_buffer* key, keymaster_key_param_set_t* characteristics);

// open_v1_key: the same for a blob of the earlier Keymaster TA, which that TA opens: a session with
// it, command 27. On failure the outputs are empty. Keymaster errors: -33 characteristics that do
// not unmarshal; -41 out of memory. TEE codes: those of the session (TEE_ERROR_ITEM_NOT_FOUND where
// there is no such TA) and of the earlier TA, unchanged; TEE_ERROR_GENERIC for an answer that is
// longer than the blob or whose inner lengths do not fit.
outcome open_v1_key(byte_view blob, heap_buffer* key, keymaster_key_param_set_t* characteristics);

}  // namespace keymaster
