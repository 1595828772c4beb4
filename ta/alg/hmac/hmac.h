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

// The row of a Keymaster digest, or of a platform object type; null when there is none.
const hmac_hash_t* hmac_hash_of_digest(uint32_t digest);
const hmac_hash_t* hmac_hash_of_type(uint32_t object_type);

// hmac_generate_key, hmac_import_key: check the description, complete it into the characteristics
// and build the key material from random bytes, or from `key_data`. -38: a tag that only the TA may
// set, or one absent or repeated. -44: the key size given is not that of the data. -6: size 0,
// above 1024 bits or not whole bytes. -59: minimum MAC length. -12: digest.
TEE_Result hmac_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material,
                             keymaster_error_t* km_error);
TEE_Result hmac_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                           heap_buffer* key_material, keymaster_error_t* km_error);

// hmac_key_t: a key that is loaded into the platform, normalised to its hash's block size.
struct hmac_key_t {
  tee_object object;
  uint32_t key_bits = 0;  // the block size
  uint32_t object_type = 0;
};

// hmac_resolve_key_data: loads key material. TEE_ERROR_GENERIC: the record is too short. -41:
// unknown object type.
[[nodiscard]] TEE_Result hmac_resolve_key_data(byte_view key_material, hmac_key_t* key,
                                               keymaster_error_t* km_error);

}  // namespace keymaster
