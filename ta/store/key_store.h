// The key storage keys (KSK), under which key blobs are sealed: one derived from the device's
// identifier at every start, and one random secret in replay-protected storage where the TEE has
// it.
#pragma once

#include "tee_extensions.h"

#include "ta/base/tee_handles.h"

namespace keymaster {

constexpr size_t KSK_SIZE = 32;
constexpr size_t SALT_SIZE = 64;

// The TA's own TEE-level codes.
// The stored RPMB KSK had the wrong length and was deleted: every blob made under it is lost.
constexpr TEE_Result KEY_STORE_ERROR_KSK_DELETED = 0xF0100001;
// A blob needs the RPMB KSK, which is not loaded.
constexpr TEE_Result KEY_STORE_ERROR_KSK_MISSING = 0xF0100003;

// key_store_init: derives the one KSK and, where there is RPMB storage, loads or creates the other.
// Called once per instance, before anything else; a failure ends the instance's creation. Returns
// the platform's code, or KEY_STORE_ERROR_KSK_DELETED (the next creation makes a new KSK).
[[nodiscard]] TEE_Result key_store_init();

// key_store_destroy: frees both keys.
void key_store_destroy();

// The two keys, as HMAC-SHA256 objects of 256 bits. The RPMB one is null on a device without RPMB.
TEE_ObjectHandle rpmb_ksk();
TEE_ObjectHandle derived_ksk();

// TEE_DeriveKK: the key-encryption key of one blob: HMAC-SHA256(ksk, salt) as an AES-256 key.
// `salt`: SALT_SIZE bytes. On failure *out_key is empty.
[[nodiscard]] TEE_Result TEE_DeriveKK(TEE_ObjectHandle ksk, byte_view salt, tee_object* out_key);

}  // namespace keymaster
