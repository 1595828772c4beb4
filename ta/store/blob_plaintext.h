// The plaintext that blobs of this TA and of the earlier one share: u32 K, K bytes of key material,
// u32 P, P bytes of marshalled characteristics with every tag; little-endian.
#pragma once

#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/params/param_set.h"

namespace keymaster {

// parse_plaintext: takes a plaintext apart: *plaintext is cut to the key material, what follows the
// characteristics is ignored. Keymaster errors: `unreadable_set` for characteristics that do not
// unmarshal. TEE_ERROR_GENERIC: a length passes the end. On failure *plaintext is as it was.
outcome parse_plaintext(heap_buffer* plaintext, keymaster_error_t unreadable_set,
                        keymaster_key_param_set_t* characteristics);

}  // namespace keymaster
