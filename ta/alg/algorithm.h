// The contracts between the commands and the algorithms: the descriptor of an algorithm, the method
// table of one of its purposes, and the operation object that a begin makes.
#pragma once

#include "ta/base/bytes.h"
#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/params/param_set.h"

namespace keymaster {

// The subject public key of a certificate under construction (ta/der).
struct X509_PUBKEY;

struct operation_t;

// update_step: one update of an operation.
struct update_step {
  const keymaster_key_param_set_t& params;
  byte_view input;
  byte_span output;     // may be the client's shared memory: never read back
  byte_view request;    // all of the command's input; `output` may share memory with it
  size_t consumed = 0;  // bytes taken of `input`
  size_t produced = 0;  // bytes written to `output`
};

// finish_step: the end of an operation.
struct finish_step {
  const keymaster_key_param_set_t& params;
  byte_view input;
  heap_buffer output{};  // stays empty when there is none
  keymaster_key_param_set_t out_params{};
};

// operation_slots_t: the entry points of an operation object.
struct operation_slots_t {
  // Destroys the record. Members that are missing are traced, never a failure; null is legal.
  void (*free)(operation_t* operation);

  // Feeds the step's input. A failure leaves the object fit for free. Null when the purpose has no
  // such step.
  outcome (*update)(operation_t* operation, update_step* step);

  // Completes the operation. Null when there is no such step.
  outcome (*finish)(operation_t* operation, finish_step* step);
};

// operation_t: what every operation object begins with. It lives from a successful begin until the
// command that ends it; update and finish never need to know the algorithm. Each algorithm derives
// a plain record that owns its handles and buffers as members.
struct operation_t : operation_slots_t {
  // Empty when created; begin moves the opened key's characteristics in.
  keymaster_key_param_set_t key_characteristics;

  void install(const operation_slots_t& entries) {
    static_cast<operation_slots_t&>(*this) = entries;
  }
};

// begin_request: what an operation is made of.
struct begin_request {
  byte_view key_material;
  const keymaster_key_param_set_t& key_characteristics;
  const keymaster_key_param_set_t& params;
  keymaster_key_param_set_t* out_params;  // for output parameters, such as a generated nonce
};

// operation_methods_t: one constant table per algorithm and purpose. The three queries tell which
// padding, block mode and digest the operation will use, from the begin parameters: true and
// *value, or false when the purpose takes none. create_operation and authorisation share them, so
// both see the same value.
struct operation_methods_t {
  // Makes the object. On failure *operation is null; a platform failure, which was traced where it
  // happened, arrives as KM_ERROR_UNKNOWN_ERROR.
  keymaster_error_t (*create_operation)(const begin_request& request, operation_t** operation);
  bool (*get_padding)(const keymaster_key_param_set_t& params, uint32_t* value);
  bool (*get_block_mode)(const keymaster_key_param_set_t& params, uint32_t* value);
  bool (*get_digest)(const keymaster_key_param_set_t& params, uint32_t* value);
};

// algorithm_t: the constant descriptor of an algorithm. A null slot is a function it does not
// offer.
struct algorithm_t {
  uint32_t algorithm;  // KM_ALGORITHM_*
  const char* name;    // as it stands in messages

  // The method table of a purpose, or null.
  const operation_methods_t* (*get_operation_methods)(uint32_t purpose);

  // Make key material. The description becomes the key's characteristics: both add entries to it
  // (origin, versions, creation time), which stay there when a later check fails. `key_data` is in
  // TA memory.
  outcome (*generate_key)(keymaster_key_param_set_t* description, heap_buffer* key_material);
  outcome (*import_key)(keymaster_key_param_set_t* description, byte_view key_data,
                        heap_buffer* key_material);

  // Writes the exported form into `output` and its length to *produced.
  outcome (*export_key)(byte_view key_material, byte_span output, size_t* produced);

  // Fills the subject public key of a certificate.
  outcome (*set_key_info)(byte_view key_material, X509_PUBKEY* subject_public_key);
};

// find_algorithm: the descriptor with this KM_ALGORITHM_* value, or null.
const algorithm_t* find_algorithm(uint32_t algorithm);

// The answers of tables whose purpose takes no padding, block mode or digest.
bool takes_none(const keymaster_key_param_set_t& params, uint32_t* value);
// The unique KM_TAG_DIGEST of `params`; false when it is absent or repeated.
bool requested_digest(const keymaster_key_param_set_t& params, uint32_t* value);
// The unique KM_TAG_PADDING of `params`; false when it is absent or repeated.
bool requested_padding(const keymaster_key_param_set_t& params, uint32_t* value);

// refuse_export: the export_key of symmetric keys: KM_ERROR_UNSUPPORTED_KEY_FORMAT.
outcome refuse_export(byte_view key_material, byte_span output, size_t* produced);

// free_operation: the body of every `free`. T derives from operation_t, names itself in
// T::TYPE_NAME and tells in missing() how many of its mandatory members are not there.
template <class T>
void free_operation(operation_t* operation) {
  auto* record = static_cast<T*>(operation);
  if (record == nullptr) {
    trace(TEE_TRACE_ERROR, "Try to free NULL %s", T::TYPE_NAME);
    return;
  }
  for (int i = record->missing(); i > 0; i--) {
    trace(TEE_TRACE_ERROR, "Try to free invalid %s", T::TYPE_NAME);
  }
  heap_delete(record);
}

// create_operation_object: the frame of every create: a record of type T with its slots, then
// `prepare(T*)`, which gives an outcome. On failure the record is gone and *operation null.
template <class T, class Prepare>
keymaster_error_t create_operation_object(const operation_slots_t& slots, operation_t** operation,
                                          Prepare prepare) {
  *operation = nullptr;
  heap_ptr<T> record(heap_new<T>());
  if (!record) return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  record->install(slots);
  const outcome prepared = prepare(record.get());
  if (failed(prepared)) return settle_failure({TEE_SUCCESS, prepared.error}).error;
  *operation = record.release();
  return KM_ERROR_OK;
}

}  // namespace keymaster
