// The configured state.
#include "ta/commands/configured.h"

namespace keymaster {
namespace {

configured_t state;

}  // namespace

const configured_t& configured() {
  return state;
}

void configured_init() {
  state = {};
}

void configured_set(const keymaster_key_param_set_t& set) {
  for (const keymaster_key_param_t& param : set) {
    if (param.tag == KM_TAG_OS_VERSION) state.configured_os_version = param.integer;
    if (param.tag == KM_TAG_OS_PATCHLEVEL) state.configured_os_patchlevel = param.integer;
  }
  state.is_configured = true;
}

bool key_requires_upgrade(const keymaster_key_param_set_t& key_characteristics) {
  const auto* version = get_unique(key_characteristics, KM_TAG_OS_VERSION);
  const auto* patchlevel = get_unique(key_characteristics, KM_TAG_OS_PATCHLEVEL);
  return version == nullptr || patchlevel == nullptr ||
         version->integer < state.configured_os_version ||
         patchlevel->integer < state.configured_os_patchlevel;
}

bool key_version_mismatch(const keymaster_key_param_set_t& key_characteristics) {
  const auto* version = get_unique(key_characteristics, KM_TAG_OS_VERSION);
  const auto* patchlevel = get_unique(key_characteristics, KM_TAG_OS_PATCHLEVEL);
  return version == nullptr || patchlevel == nullptr ||
         version->integer != state.configured_os_version ||
         patchlevel->integer != state.configured_os_patchlevel;
}

}  // namespace keymaster
