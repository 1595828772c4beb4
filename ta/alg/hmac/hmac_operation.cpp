// HMAC operations: computing a MAC, and the verification that never succeeds.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/hmac/hmac.h"

namespace keymaster {
namespace {

constexpr size_t MAX_MAC_SIZE = 64;

struct hmac_operation_t : operation_t {
  tee_object key;
  tee_operation mac;
  uint32_t mac_bits = 0;

  int missing() const { return (key ? 0 : 1) + (mac ? 0 : 1); }
};

struct hmac_sign_operation_t : hmac_operation_t {
  static constexpr char TYPE_NAME[] = "hmac_sign_operation_t";
};

struct hmac_verify_operation_t : hmac_operation_t {
  static constexpr char TYPE_NAME[] = "hmac_verify_operation_t";
};

// Everything of create that can fail after the record is there.
outcome prepare(hmac_operation_t* operation, const begin_request& request) {
  const hmac_hash_t* hash = nullptr;
  const outcome loaded = hmac_resolve_key_data(request.key_material, &operation->key, &hash);
  if (failed(loaded)) {
    trace(TEE_TRACE_ERROR, "Resolve key data failed");
    return loaded;
  }
  const auto* mac_length = get_unique(request.params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_MAC_LENGTH");
  }
  operation->mac_bits = mac_length->integer;
  TRY(operation->mac.allocate(hash->mac_algorithm, TEE_MODE_MAC, hash->block_bits));
  TRY(operation->mac.set_key(operation->key.get()));
  TEE_MACInit(operation->mac.get(), nullptr, 0);
  return DONE;
}

void hmac_sign_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<hmac_sign_operation_t>(operation);
}

void hmac_verify_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<hmac_verify_operation_t>(operation);
}

outcome hmac_update(operation_t* operation, update_step* step) {
  const byte_view input = step->input;
  TEE_MACUpdate(static_cast<hmac_operation_t*>(operation)->mac.get(), input.data(),
                static_cast<tee_size>(input.size()));
  step->consumed = input.size();
  return DONE;
}

// The input of finish is intentionally not part of the MAC: all data comes through update, and
// clients of this system rely on it.
outcome hmac_sign_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<hmac_operation_t*>(operation);
  const size_t wanted = record->mac_bits / 8;
  heap_buffer result;
  // A length that no hash reaches is not worth the memory; it is refused below.
  if (!result.allocate(std::min(wanted, MAX_MAC_SIZE))) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory, need %dB",
                  static_cast<int>(wanted));
  }
  secret_bytes<MAX_MAC_SIZE> mac;
  size_t length = 0;
  TRY(record->mac.mac_final({}, mac, &length));
  if (length < wanted) {
    return refuse(KM_ERROR_UNKNOWN_ERROR,
                  "Too short output of HMAC operation, expect at least %dB, got %dB",
                  static_cast<int>(wanted), static_cast<int>(length));
  }
  copy_bytes(result.span(), byte_view(mac).first(wanted));
  step->output = std::move(result);
  return DONE;
}

// HMAC verification can be begun and fed, but always ends like this: intended, and relied upon. A
// client verifies a MAC by computing it.
outcome hmac_verify_finish(operation_t* operation, finish_step*) {
  const trace_scope scope;
  return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory, need %dB",
                static_cast<int>(static_cast<hmac_operation_t*>(operation)->mac_bits / 8));
}

keymaster_error_t create_hmac_sign(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<hmac_sign_operation_t>(
      {hmac_sign_free, hmac_update, hmac_sign_finish}, operation,
      [&](hmac_operation_t* record) { return prepare(record, request); });
}

keymaster_error_t create_hmac_verify(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<hmac_verify_operation_t>(
      {hmac_verify_free, hmac_update, hmac_verify_finish}, operation,
      [&](hmac_operation_t* record) { return prepare(record, request); });
}

constexpr operation_methods_t HMAC_SIGN_METHODS = {
    .create_operation = create_hmac_sign,
    .get_padding = takes_none,
    .get_block_mode = takes_none,
    .get_digest = requested_digest,
};

constexpr operation_methods_t HMAC_VERIFY_METHODS = {
    .create_operation = create_hmac_verify,
    .get_padding = takes_none,
    .get_block_mode = takes_none,
    .get_digest = requested_digest,
};

const operation_methods_t* hmac_get_operation_methods(uint32_t purpose) {
  if (purpose == KM_PURPOSE_SIGN) return &HMAC_SIGN_METHODS;
  return purpose == KM_PURPOSE_VERIFY ? &HMAC_VERIFY_METHODS : nullptr;
}

}  // namespace

const algorithm_t HMAC_ALGORITHM = {
    .algorithm = KM_ALGORITHM_HMAC,
    .name = "HMAC",
    .get_operation_methods = hmac_get_operation_methods,
    .generate_key = hmac_generate_key,
    .import_key = hmac_import_key,
    .export_key = refuse_export,
    .set_key_info = nullptr,
};

}  // namespace keymaster
