// The tags that the TA adds to the description of a new key.
#include "ta/alg/provenance.h"

#include "tee_internal_api.h"

#include "ta/commands/configured.h"

namespace keymaster {

keymaster_error_t add_own_tag(keymaster_key_param_set_t* description, keymaster_tag_t tag,
                              const char* name, uint64_t value) {
  if (contains_tag(*description, tag)) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "Shouldn't specify %s", name);
  }
  if (!add_long(description, tag, value)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return KM_ERROR_OK;
}

keymaster_error_t add_provenance(keymaster_key_param_set_t* description, uint32_t origin,
                                 creation_time created) {
  TEE_Time now{};
  TEE_GetREETime(&now);
  const struct {
    keymaster_tag_t tag;
    const char* name;
    uint64_t value;
  } tags[] = {
      {KM_TAG_ORIGIN, "KM_TAG_ORIGIN", origin},
      {KM_TAG_OS_VERSION, "KM_TAG_OS_VERSION", configured().configured_os_version},
      {KM_TAG_OS_PATCHLEVEL, "KM_TAG_OS_PATCHLEVEL", configured().configured_os_patchlevel},
      {KM_TAG_CREATION_DATETIME, "KM_TAG_CREATION_DATETIME", uint64_t{now.seconds} * 1000},
  };
  for (const auto& [tag, name, value] : tags) {
    if (tag == KM_TAG_CREATION_DATETIME && created == creation_time::NOT_ADDED) continue;
    TRY(add_own_tag(description, tag, name, value));
  }
  return KM_ERROR_OK;
}

}  // namespace keymaster
