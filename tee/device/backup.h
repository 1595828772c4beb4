// Backups of a device: its files in one.
//
// Little-endian: "KMBK", u32 form (1), then device.key, identity, device.json, replay and
// storage.db, each a u64 length and its bytes, HMAC-SHA256 of all before under the device's key.
#pragma once

#include <string>

#include "tee/device/folder.h"
#include "tee/device/sealing.h"

namespace tee {

// write_backup: puts the files of a device, which is locked, into the new file `file` (mode 0600),
// durably or not at all. EXISTS when it is there, else file_error.
void write_backup(const device_folder& folder, const device_key& key, const std::string& file);

// read_backup: puts the files of a backup into a new folder; returns the device's key. NOT_FOUND
// when there is no such file, DAMAGED when it is no authentic backup.
device_key read_backup(const std::string& file, const device_folder& folder);

}  // namespace tee
