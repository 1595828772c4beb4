// What the factory gave the device for SOTER, fetched from the vault once and kept for the life of
// the instance: the device's key pair (the ATTK) and the properties that signed documents name.
#pragma once

#include "tee_internal_api.h"

#include "ta/base/heap.h"

namespace keymaster {

// The device's RSA key: big-endian unsigned integers. The five CRT values are empty when the device
// was given n, e and d alone.
struct soter_key_pair_t {
  heap_buffer n;
  heap_buffer d;
  heap_buffer e;
  heap_buffer p;
  heap_buffer q;
  heap_buffer dp;
  heap_buffer dq;
  heap_buffer qinv;
};

// The device's properties: texts as bytes without a terminating zero.
struct soter_prop_set_t {
  heap_buffer fp_name;                     // of the fingerprint sensor
  heap_buffer fp_version;                  // of the fingerprint sensor
  uint8_t fp_uuid[sizeof(TEE_UUID)] = {};  // of the fingerprint TA, as provisioned
  heap_buffer cpu_id;                      // at most 64 bytes
  heap_buffer tee_name;                    // at most 63 bytes
  heap_buffer tee_version;                 // at most 63 bytes
};

// soter_check_init: loads both records unless they are loaded; every SOTER operation begins with
// it. A failed load keeps nothing, and the next call tries again. Fails with the codes below.
[[nodiscard]] TEE_Result soter_check_init();

// soter_init: loads both. soter_deinit: gives both back, wiped.
[[nodiscard]] TEE_Result soter_init();
void soter_deinit();

// soter_forget: nothing is loaded; what an earlier instance in this process left is forgotten, not
// freed.
void soter_forget();

// What is loaded; only after soter_check_init has succeeded.
const soter_key_pair_t& soter_key_pair();
const soter_prop_set_t& soter_prop_set();

// init_soter_key: loads a key pair from the vault. TEE_ERROR_OUT_OF_MEMORY;
// TEE_ERROR_BAD_PARAMETERS: the vault's answer lacks a value; otherwise the code of
// retrieve_key_from_vault. On failure *key_pair is empty.
[[nodiscard]] TEE_Result init_soter_key(soter_key_pair_t* key_pair);

// init_soter_prop_set: loads the properties from the vault and from the TEE.
// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_GENERIC: a property is missing or has a wrong length;
// otherwise the code of retrieve_property_from_vault or of the platform. On failure *prop_set is
// empty.
[[nodiscard]] TEE_Result init_soter_prop_set(soter_prop_set_t* prop_set);

}  // namespace keymaster
