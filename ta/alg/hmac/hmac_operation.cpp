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
  uint32_t key_bits = 0;
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
TEE_Result prepare(hmac_operation_t* operation, byte_view key_material,
                   const keymaster_key_param_set_t& begin_params, keymaster_error_t* km_error) {
  hmac_key_t key;
  const TEE_Result resolved = hmac_resolve_key_data(key_material, &key, km_error);
  if (failed(resolved, *km_error)) {
    trace_error("Resolve key data failed");
    return resolved;
  }
  operation->key = std::move(key.object);
  operation->key_bits = key.key_bits;
  const auto* mac_length = get_unique(begin_params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    trace_error("No or too many KM_TAG_MAC_LENGTH");
    *km_error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  operation->mac_bits = mac_length->integer;
  const hmac_hash_t* hash = hmac_hash_of_type(key.object_type);
  if (hash == nullptr) {
    trace_error("Unsupported key type");
    *km_error = KM_ERROR_INVALID_KEY_BLOB;
    return TEE_SUCCESS;
  }
  if (TEE_Result res =
          operation->mac.allocate(hash->mac_algorithm, TEE_MODE_MAC, operation->key_bits)) {
    return res;
  }
  if (TEE_Result res = operation->mac.set_key(operation->key.get())) return res;
  TEE_MACInit(operation->mac.get(), nullptr, 0);
  return TEE_SUCCESS;
}

TEE_Result feed(operation_t* operation, byte_view input, size_t* consumed, size_t* produced) {
  auto* record = static_cast<hmac_operation_t*>(operation);
  TEE_MACUpdate(record->mac.get(), input.data(), static_cast<tee_size>(input.size()));
  *consumed = input.size();
  *produced = 0;
  return TEE_SUCCESS;
}

void hmac_sign_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<hmac_sign_operation_t>(operation);
}

void hmac_verify_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<hmac_verify_operation_t>(operation);
}

TEE_Result hmac_sign_update(operation_t* operation, const keymaster_key_param_set_t&,
                            byte_view input, size_t* consumed, byte_span, size_t* produced,
                            keymaster_error_t*) {
  return feed(operation, input, consumed, produced);
}

TEE_Result hmac_verify_update(operation_t* operation, const keymaster_key_param_set_t&,
                              byte_view input, size_t* consumed, byte_span, size_t* produced,
                              keymaster_error_t*) {
  return feed(operation, input, consumed, produced);
}

// The input of finish is intentionally not part of the MAC: all data comes through update, and
// clients of this system rely on it.
TEE_Result hmac_sign_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                            heap_buffer* output, keymaster_key_param_set_t*,
                            keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<hmac_operation_t*>(operation);
  const size_t wanted = record->mac_bits / 8;
  heap_buffer result;
  // A length that no hash reaches is not worth the memory; it is refused below.
  if (!result.allocate(std::min(wanted, MAX_MAC_SIZE))) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory, need %dB",
                   static_cast<int>(wanted));
  }
  uint8_t mac[MAX_MAC_SIZE];
  size_t length = 0;
  if (TEE_Result res = record->mac.mac_final({}, mac, &length)) return res;
  if (length < wanted) {
    wipe(mac);
    return KM_FAIL(km_error, KM_ERROR_UNKNOWN_ERROR,
                   "Too short output of HMAC operation, expect at least %dB, got %dB",
                   static_cast<int>(wanted), static_cast<int>(length));
  }
  copy_bytes(result.span(), byte_view(mac).first(wanted));
  wipe(mac);
  *output = std::move(result);
  return TEE_SUCCESS;
}

// HMAC verification can be begun and fed, but always ends like this: intended, and relied upon. A
// client verifies a MAC by computing it.
TEE_Result hmac_verify_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                              heap_buffer*, keymaster_key_param_set_t*,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  const auto* record = static_cast<hmac_operation_t*>(operation);
  return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory, need %dB",
                 static_cast<int>(record->mac_bits / 8));
}

operation_t* create_hmac_sign(byte_view key_material, const keymaster_key_param_set_t&,
                              const keymaster_key_param_set_t& begin_params,
                              keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<hmac_sign_operation_t>(
      {hmac_sign_free, hmac_sign_update, hmac_sign_finish}, km_error,
      [&](hmac_operation_t* operation) {
        return prepare(operation, key_material, begin_params, km_error);
      });
}

operation_t* create_hmac_verify(byte_view key_material, const keymaster_key_param_set_t&,
                                const keymaster_key_param_set_t& begin_params,
                                keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<hmac_verify_operation_t>(
      {hmac_verify_free, hmac_verify_update, hmac_verify_finish}, km_error,
      [&](hmac_operation_t* operation) {
        return prepare(operation, key_material, begin_params, km_error);
      });
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
  switch (purpose) {
    case KM_PURPOSE_SIGN:
      return &HMAC_SIGN_METHODS;
    case KM_PURPOSE_VERIFY:
      return &HMAC_VERIFY_METHODS;
    default:
      return nullptr;
  }
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
