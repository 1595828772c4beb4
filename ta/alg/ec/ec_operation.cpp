// ECDSA: signing and verification.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/ec/ec.h"
#include "ta/alg/ec/ec_signature.h"
#include "ta/alg/message.h"

namespace keymaster {
namespace {

constexpr size_t MAX_DIGEST_SIZE = 64;

// An ECDSA operation. Lives from create to free.
struct ec_operation_t : operation_t {
  tee_operation main;
  tee_object key;
  message_t message;
  const ec_curve_t* curve = nullptr;

  int missing() const { return (key ? 0 : 1) + (main ? 0 : 1) + (message.buffer ? 0 : 1); }
};

struct ec_sign_operation_t : ec_operation_t {
  static constexpr char TYPE_NAME[] = "ec_sign_operation_t";
};

struct ec_verify_operation_t : ec_operation_t {
  static constexpr char TYPE_NAME[] = "ec_verify_operation_t";
};

TEE_Result load(ec_operation_t* operation, byte_view key_material, keymaster_error_t* km_error) {
  uint32_t key_bits = 0;
  const TEE_Result res = ec_resolve_key_data(key_material, &operation->key, &key_bits, km_error);
  if (failed(res, *km_error)) {
    trace_error("Resolve key data failed");
    return res;
  }
  operation->curve = find_ec_curve(key_bits);
  return TEE_SUCCESS;
}

keymaster_error_t read_digest(const keymaster_key_param_set_t& begin_params, uint32_t* digest) {
  if (!requested_digest(begin_params, digest)) {
    trace_error("No or too many KM_TAG_DIGEST");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (*digest == KM_DIGEST_MD5) return KM_ERROR_INCOMPATIBLE_DIGEST;
  return *digest > KM_DIGEST_SHA_2_512 ? KM_ERROR_UNSUPPORTED_DIGEST : KM_ERROR_OK;
}

// The room for a digest, or for as many bytes of data as the curve takes.
TEE_Result prepare_message(ec_operation_t* operation, const keymaster_key_param_set_t& begin_params,
                           keymaster_error_t* km_error) {
  message_t& message = operation->message;
  *km_error = read_digest(begin_params, &message.digest);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  const bool hashes = message.digest != KM_DIGEST_NONE;
  if (hashes) {
    if (TEE_Result res = message.start_hash()) return res;
  }
  if (!message.buffer.allocate(hashes ? MAX_DIGEST_SIZE : operation->curve->size())) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

// Everything of create that can fail after the record is there.
TEE_Result prepare(ec_operation_t* operation, uint32_t tee_mode, byte_view key_material,
                   const keymaster_key_param_set_t& begin_params, keymaster_error_t* km_error) {
  TEE_Result res = load(operation, key_material, km_error);
  if (failed(res, *km_error)) return res;
  res = prepare_message(operation, begin_params, km_error);
  if (failed(res, *km_error)) return res;
  const ec_curve_t& curve = *operation->curve;
  res = operation->main.allocate(curve.tee_algorithm, tee_mode, curve.key_bits);
  if (res != TEE_SUCCESS) return res;
  return operation->main.set_key(operation->key.get());
}

// Data that is not hashed is cut to the curve's bytes, intended: *consumed tells what was taken.
TEE_Result ec_update(operation_t* operation, const keymaster_key_param_set_t&, byte_view input,
                     size_t* consumed, byte_span, size_t* produced, keymaster_error_t*) {
  message_t& message = static_cast<ec_operation_t*>(operation)->message;
  *produced = 0;
  if (message.is_hashed()) {
    TEE_DigestUpdate(message.hash.get(), input.data(), static_cast<tee_size>(input.size()));
  } else {
    input = input.first(std::min(input.size(), message.room()));
    message.append(input);
  }
  *consumed = input.size();
  return TEE_SUCCESS;
}

void shift_right(byte_span number, unsigned bits) {
  for (size_t i = number.size(); i-- > 0;) {
    const unsigned higher = i == 0 ? 0 : number[i - 1];
    number[i] = static_cast<uint8_t>((higher << 8 | number[i]) >> bits);
  }
}

// Brings the message into the form in which it is signed: the leftmost key size bits of the digest
// or data, as a number. Shorter ones stay as they are.
TEE_Result represent(ec_operation_t* operation) {
  message_t& message = operation->message;
  const ec_curve_t& curve = *operation->curve;
  if (message.is_hashed()) {
    if (TEE_Result res = message.finish_hash()) return res;
  }
  message.length = std::min(message.length, curve.size());
  if (message.length * 8 > curve.key_bits) {
    shift_right(message.buffer.span().first(message.length), 8 - curve.key_bits % 8);
  }
  return TEE_SUCCESS;
}

void ec_sign_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<ec_sign_operation_t>(operation);
}

void ec_verify_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<ec_verify_operation_t>(operation);
}

// The data of finish is intentionally not part of what is signed: all data comes through update.
TEE_Result ec_sign_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                          heap_buffer* output, keymaster_key_param_set_t*,
                          keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<ec_sign_operation_t*>(operation);
  if (TEE_Result res = represent(record)) return res;
  heap_buffer raw;
  if (!raw.allocate(2 * record->curve->size())) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  if (TEE_Result res = sign_digest(record->main, {}, record->message.data(), &raw)) return res;
  const byte_view r = raw.view().first(raw.size() / 2);
  const byte_view s = raw.view().subspan(r.size());
  if (der_encode_ec_signature(r, s, output) != TEE_SUCCESS) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return TEE_SUCCESS;
}

// Decodes the client's signature, from a copy since decoding reads it more than once, into r || s.
keymaster_error_t decode(byte_view signature, heap_buffer* raw, const ec_curve_t& curve) {
  heap_buffer der;
  if (!der.copy_of(signature) || !raw->allocate(2 * curve.size())) {
    trace_error("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  const byte_span r = raw->span().first(curve.size());
  const byte_span s = raw->span().subspan(curve.size());
  if (TEE_Result res = der_decode_ec_signature(der.view(), r, s)) {
    trace_error("Decode signature failed, 0x%08x", res);
    return KM_ERROR_VERIFICATION_FAILED;
  }
  return KM_ERROR_OK;
}

TEE_Result ec_verify_finish(operation_t* operation, const keymaster_key_param_set_t&,
                            byte_view signature, heap_buffer*, keymaster_key_param_set_t*,
                            keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<ec_verify_operation_t*>(operation);
  if (TEE_Result res = represent(record)) return res;
  heap_buffer raw;
  *km_error = decode(signature, &raw, *record->curve);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  return verify_digest(record->main, {}, record->message.data(), raw.view(), km_error);
}

constexpr operation_methods_t EC_SIGN_METHODS = {
    .create_operation = create_ec_sign,
    .get_padding = takes_none,
    .get_block_mode = takes_none,
    .get_digest = requested_digest,
};

constexpr operation_methods_t EC_VERIFY_METHODS = {
    .create_operation = create_ec_verify,
    .get_padding = takes_none,
    .get_block_mode = takes_none,
    .get_digest = requested_digest,
};

const operation_methods_t* ec_get_operation_methods(uint32_t purpose) {
  switch (purpose) {
    case KM_PURPOSE_SIGN:
      return &EC_SIGN_METHODS;
    case KM_PURPOSE_VERIFY:
      return &EC_VERIFY_METHODS;
    default:
      return nullptr;
  }
}

}  // namespace

operation_t* create_ec_sign(byte_view key_material, const keymaster_key_param_set_t&,
                            const keymaster_key_param_set_t& begin_params,
                            keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<ec_sign_operation_t>(
      {ec_sign_free, ec_update, ec_sign_finish}, km_error, [&](ec_sign_operation_t* operation) {
        return prepare(operation, TEE_MODE_SIGN, key_material, begin_params, km_error);
      });
}

operation_t* create_ec_verify(byte_view key_material, const keymaster_key_param_set_t&,
                              const keymaster_key_param_set_t& begin_params,
                              keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<ec_verify_operation_t>(
      {ec_verify_free, ec_update, ec_verify_finish}, km_error,
      [&](ec_verify_operation_t* operation) {
        return prepare(operation, TEE_MODE_VERIFY, key_material, begin_params, km_error);
      });
}

const algorithm_t EC_ALGORITHM = {
    .algorithm = KM_ALGORITHM_EC,
    .name = "EC",
    .get_operation_methods = ec_get_operation_methods,
    .generate_key = ec_generate_key,
    .import_key = ec_import_key,
    .export_key = ec_export_key,
    .set_key_info = ec_set_key_info,
};

}  // namespace keymaster
