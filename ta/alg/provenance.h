// Where a key comes from: the tags that the TA itself adds to the description of a new key, and
// that a client may not give.
#pragma once

#include "ta/params/param_set.h"

namespace keymaster {

// add_own_tag: refuses a description that has the tag (KM_ERROR_INVALID_ARGUMENT), else appends it.
// KM_ERROR_MEMORY_ALLOCATION_FAILED when the set cannot grow. `name` is the tag's in messages.
[[nodiscard]] keymaster_error_t add_own_tag(keymaster_key_param_set_t* description,
                                            keymaster_tag_t tag, const char* name, uint64_t value);

enum class creation_time : uint8_t { ADDED, NOT_ADDED };

// add_provenance: adds KM_TAG_ORIGIN, KM_TAG_OS_VERSION, KM_TAG_OS_PATCHLEVEL and, if ADDED,
// KM_TAG_CREATION_DATETIME (whole REE seconds, in ms), in this order. Codes as add_own_tag.
[[nodiscard]] keymaster_error_t add_provenance(keymaster_key_param_set_t* description,
                                               uint32_t origin,
                                               creation_time created = creation_time::ADDED);

}  // namespace keymaster
