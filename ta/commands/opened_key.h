// What the commands share that take a key blob or a parameter set, or write a set to the client.
#pragma once

#include "ta/alg/algorithm.h"
#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/params/param_set.h"

namespace keymaster {

// opened_key: a key blob, copied into TA memory, and what it holds.
struct opened_key {
  heap_buffer blob;
  heap_buffer material;
  keymaster_key_param_set_t characteristics;
};

// read_params: the set that a command brings; TEE_ERROR_BAD_PARAMETERS when it cannot be read.
[[nodiscard]] TEE_Result read_params(byte_view marshalled, keymaster_key_param_set_t* params);

// read_use: an input of two fields, key blob and set. TEE_ERROR_GENERIC when it is too short, and
// as read_params.
[[nodiscard]] TEE_Result read_use(byte_view input, byte_view* blob,
                                  keymaster_key_param_set_t* params);

// open_checked_key: copies `blob` and opens it; refuses keys older or newer than the configured
// system. Whatever open_key says, a blob that does not open is -62; -33 for a newer key; -41 out of
// memory.
[[nodiscard]] keymaster_error_t open_checked_key(byte_view blob, opened_key* key);

// key_request: the input that get_key_character_size, get_key_character and export_key share: key
// blob, application identifier and application data, each a field. An empty field is none.
struct key_request {
  byte_view blob;
  byte_view app_id;
  byte_view app_data;
};
[[nodiscard]] bool read_key_request(byte_view input, key_request* request);

// check_application: the key's application binding (-33).
[[nodiscard]] keymaster_error_t check_application(const keymaster_key_param_set_t& characteristics,
                                                  byte_view app_id, byte_view app_data);

// open_requested_key: open_checked_key, then the application binding.
[[nodiscard]] keymaster_error_t open_requested_key(const key_request& request, opened_key* key);

// operating_algorithm: the algorithm of a key that has operations; -1000: none is named, -4.
[[nodiscard]] keymaster_error_t operating_algorithm(
    const keymaster_key_param_set_t& characteristics, const algorithm_t** algorithm);

// write_blob: seals the key into `room`; *size receives the blob's bytes. A code of save_key.
[[nodiscard]] TEE_Result write_blob(byte_view material,
                                    const keymaster_key_param_set_t& characteristics,
                                    byte_span room, size_t* size);

// write_set: marshals `set` without its application tags into `room`; *written receives the bytes.
[[nodiscard]] TEE_Result write_set(const keymaster_key_param_set_t& set, byte_span room,
                                   size_t* written);

// write_last_set: the same as a field, the last of `out`; *total receives the bytes of all fields.
// TEE_ERROR_GENERIC, traced, when there is no room for its length.
[[nodiscard]] TEE_Result write_last_set(const keymaster_key_param_set_t& set, output_cursor* out,
                                        size_t* total);

}  // namespace keymaster
