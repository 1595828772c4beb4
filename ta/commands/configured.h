// The configured state: the OS version and patch level that the client sets once the instance is
// up, and the checks of a key's age against them.
#pragma once

#include <cstdint>

#include "ta/params/param_set.h"

namespace keymaster {

// configured_t: instance-global. Every Keymaster command but configure is refused while
// is_configured is false; it stays true until the instance ends.
struct configured_t {
  bool is_configured;
  uint32_t configured_os_version;
  uint32_t configured_os_patchlevel;
};

const configured_t& configured();

// configured_init: the state of a fresh instance, whatever an earlier one in this process left.
void configured_init();

// configured_set: stores each KM_TAG_OS_VERSION and KM_TAG_OS_PATCHLEVEL of the set in turn and
// marks the instance configured. A value whose tag is absent stays as it was.
void configured_set(const keymaster_key_param_set_t& set);

// key_requires_upgrade: the key lacks one of the two tags, or is older than the configured system.
bool key_requires_upgrade(const keymaster_key_param_set_t& key_characteristics);

// key_version_mismatch: the key lacks one of the two tags, or differs from the configured system.
// Asked after key_requires_upgrade, it catches keys that are newer.
bool key_version_mismatch(const keymaster_key_param_set_t& key_characteristics);

}  // namespace keymaster
