// What makes a device this one and no other: its key, its identity, and whether it has
// replay-protected storage.
//
// device.key: "KMDK", u32 form (1), the 32-byte key. identity: "KMDI", u32 form (1), u32 flags (bit
// 0: replay-protected storage), the 16-byte identity, the 32-byte check value of the key,
// HMAC-SHA256 of all before. Numbers are little-endian.
//
// The identity is as secret as the key: keys that are made without replay-protected storage are
// sealed under it. What is told of a device is made from it one way (public_id_of).
#pragma once

#include "tee/device/folder.h"
#include "tee/device/sealing.h"

namespace tee {

inline constexpr char KEY_FILE[] = "device.key";

struct device_secrets {
  device_key key;
  secret_bytes identity;  // a UUID in network order
  bool rpmb = true;
};

// new_secrets: those of a new device, with a fresh key.
device_secrets new_secrets(const TEE_UUID& identity, bool rpmb);

// store_identity, store_key: write the two files. The key goes last: a folder with a device.key in
// this form is complete.
void store_identity(const device_folder& folder, const device_secrets& secrets);
void store_key(const device_folder& folder, const device_secrets& secrets);

// load_secrets: throws device_error: DAMAGED when a file is missing, malformed or not authentic, or
// when the key is not the one that the identity was stored under. load_identity takes the key.
device_secrets load_secrets(const device_folder& folder);
device_secrets load_identity(const device_folder& folder, device_key key);

// identity_uuid: the identity, as gpd.tee.deviceID gives it.
TEE_UUID identity_uuid(const device_secrets& secrets);

}  // namespace tee
