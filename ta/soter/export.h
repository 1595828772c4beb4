// The export of SOTER keys.
#pragma once

#include "ta/base/bytes.h"
#include "ta/params/param_set.h"

namespace keymaster {

// soter_enhance_export_key: writes the export document of a key (documents.h) with its signature
// (the record of signing.h) into `output`, which may be shared memory: it is written once, when
// everything has succeeded. *length receives the record's size, 0 on failure. `key_params` are the
// key's characteristics; they tell who signs, with RSASSA-PKCS1-v1_5 and SHA-256: the ATTK
// (KM_TAG_SOTER_ATTK_SIGNS), else the key whose blob KM_TAG_SOTER_SIGN_KEY_BLOB or, without that,
// KM_TAG_SOTER_SIGN_KEY_NAME holds (KM_TAG_SOTER_KEY_SIGNS). TEE_ERROR_BAD_PARAMETERS: none of the
// two. TEE_ERROR_ITEM_NOT_FOUND: no blob. TEE_ERROR_BAD_STATE: the blob holds no RSA key, or the
// ATTK none that the platform takes. TEE_ERROR_SHORT_BUFFER; otherwise a code of what it calls.
[[nodiscard]] TEE_Result soter_enhance_export_key(const keymaster_key_param_set_t& key_params,
                                                  byte_view key_material, byte_span output,
                                                  size_t* length);

}  // namespace keymaster
