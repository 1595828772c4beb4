// The JSON documents of SOTER keys: what they sign in place of a client's message, and what their
// public key is exported in. Each text ends with a zero byte, which is part of what is signed.
#pragma once

#include "ta/base/heap.h"
#include "ta/params/param_set.h"

namespace keymaster {

// produce_soter_sign_json: the document around the message `raw`, signed by a key of user `uid`.
// Members in order: raw, fid (left out when no fresh notification exists), counter, uid, tee_n,
// tee_v, fp_n, fp_v, cpu_id. False, with *document empty, when the message is not UTF-8 or holds a
// zero byte, the device's data is not there, the counter cannot be raised or memory runs out. The
// counter stays raised whatever fails after it.
[[nodiscard]] bool produce_soter_sign_json(uint64_t uid, byte_view raw, heap_buffer* document);

// produce_soter_export_json: the document around the public key of `key_material`, with what the
// key's characteristics ask for. Members in order: counter (KM_TAG_SOTER_COUNTER), uid
// (KM_TAG_SOTER_UID), pub_key (PEM). On failure *document is empty; TEE_ERROR_BAD_FORMAT: no RSA
// key material; TEE_ERROR_BAD_STATE: the text could not be made; TEE_ERROR_OUT_OF_MEMORY; a code of
// the counter or of the platform. The counter stays raised whatever fails after it.
[[nodiscard]] TEE_Result produce_soter_export_json(const keymaster_key_param_set_t& key_params,
                                                   byte_view key_material, heap_buffer* document);

}  // namespace keymaster
