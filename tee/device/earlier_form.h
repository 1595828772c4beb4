// Device folders of the earlier form, and how they are brought to the present one: there the
// identity and the word on replay-protected storage stood in device.json, private objects carried
// no generation, and the replay table ("rpmb") was made at the first use.
#pragma once

#include <functional>

#include "tee/device/folder.h"
#include "tee/device/identity.h"

namespace tee {

// is_earlier_form: whether device.key is in the earlier form, the bare key. Nobody can put a folder
// back into it who does not know the key.
bool is_earlier_form(const device_folder& folder);

// earlier_secrets: those of a folder in the earlier form, or on the way from it.
device_secrets earlier_secrets(const device_folder& folder);

// bring_over: brings such a folder, which is locked, to the present form; `store_settings` writes
// device.json. Cut off at any point, it can be done again. Objects that fail their check keep
// failing it. BUSY while a program of the earlier form has the device open, DAMAGED when something
// of the folder is missing or not authentic.
void bring_over(const device_folder& folder, const device_secrets& secrets,
                const std::function<void()>& store_settings);

// remove_leftovers: removes files of the earlier form from a folder that is known to be in the
// present one.
void remove_leftovers(const device_folder& folder);

}  // namespace tee
