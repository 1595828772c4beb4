// HMAC keys and operations (FIPS 198-1). Key material: u32 key size in bits, u32 object type of the
// platform, then the key's bytes.
#pragma once

#include "ta/alg/algorithm.h"
#include "ta/base/tee_handles.h"

namespace keymaster {

extern const algorithm_t HMAC_ALGORITHM;

// hmac_hash_t: what belongs to one hash function. Sizes in bits.
struct hmac_hash_t {
  uint32_t digest;       // KM_DIGEST_*
  uint32_t object_type;  // TEE_TYPE_HMAC_*
  uint32_t mac_algorithm;
  uint32_t mac_bits;  // full length; the largest minimum that a key may ask for
  uint32_t block_bits;
};

// hmac_generate_key, hmac_import_key: check the description, complete it into the characteristics
// and build the key material from random bytes, or from `key_data`. -38: a tag that only the TA may
// set, or one absent or repeated. -44: the key size given is not that of the data. -6: size 0,
// above 1024 bits or not whole bytes. -59: minimum MAC length. -12: digest.
outcome hmac_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material);
outcome hmac_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                        heap_buffer* key_material);

// hmac_resolve_key_data: loads key material into the platform, normalised to the block size of its
// hash, which *hash receives. TEE_ERROR_GENERIC: the record is too short. -41: unknown object type.
outcome hmac_resolve_key_data(byte_view key_material, tee_object* key, const hmac_hash_t** hash);

}  // namespace keymaster
