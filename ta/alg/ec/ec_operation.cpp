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

keymaster_error_t read_digest(const keymaster_key_param_set_t& params, uint32_t* digest) {
  if (!requested_digest(params, digest)) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_DIGEST");
  }
  if (*digest == KM_DIGEST_MD5) return KM_ERROR_INCOMPATIBLE_DIGEST;
  return *digest > KM_DIGEST_SHA_2_512 ? KM_ERROR_UNSUPPORTED_DIGEST : KM_ERROR_OK;
}

// Everything of create that can fail after the record is there. The message has room for a digest,
// or for as many bytes of data as the curve takes.
outcome prepare(ec_operation_t* operation, uint32_t tee_mode, const begin_request& request) {
  message_t& message = operation->message;
  const outcome loaded =
      ec_resolve_key_data(request.key_material, &operation->key, &operation->curve);
  if (failed(loaded)) {
    trace(TEE_TRACE_ERROR, "Resolve key data failed");
    return loaded;
  }
  const ec_curve_t& curve = *operation->curve;
  TRY(read_digest(request.params, &message.digest));
  const bool hashes = message.digest != KM_DIGEST_NONE;
  if (hashes) TRY(message.start_hash());
  if (!message.buffer.allocate(hashes ? MAX_DIGEST_SIZE : curve.size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  TRY(operation->main.allocate(curve.tee_algorithm, tee_mode, curve.key_bits));
  return operation->main.set_key(operation->key.get());
}

// Data that is not hashed is cut to the curve's bytes, intended: `consumed` tells what was taken.
outcome ec_update(operation_t* operation, update_step* step) {
  message_t& message = static_cast<ec_operation_t*>(operation)->message;
  const size_t room = message.is_hashed() ? step->input.size() : message.room();
  step->consumed = std::min(step->input.size(), room);
  message.append(step->input.first(step->consumed));
  return DONE;
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
  if (message.is_hashed()) TRY(message.finish_hash());
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
outcome ec_sign_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<ec_sign_operation_t*>(operation);
  TRY(represent(record));
  heap_buffer raw;
  if (!raw.allocate(2 * record->curve->size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  TRY(sign_digest(record->main, {}, record->message.data(), &raw));
  const byte_view r = raw.view().first(raw.size() / 2);
  const byte_view s = raw.view().subspan(r.size());
  if (der_encode_ec_signature(r, s, &step->output) != TEE_SUCCESS) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return DONE;
}

// Decodes the client's signature, from a copy since decoding reads it more than once, into r || s.
keymaster_error_t decode(byte_view signature, heap_buffer* raw, const ec_curve_t& curve) {
  heap_buffer der;
  if (!der.copy_of(signature) || !raw->allocate(2 * curve.size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  const byte_span r = raw->span().first(curve.size());
  const byte_span s = raw->span().subspan(curve.size());
  if (TEE_Result res = der_decode_ec_signature(der.view(), r, s)) {
    return refuse(KM_ERROR_VERIFICATION_FAILED, "Decode signature failed, 0x%08x", res);
  }
  return KM_ERROR_OK;
}

outcome ec_verify_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<ec_verify_operation_t*>(operation);
  TRY(represent(record));
  heap_buffer raw;
  TRY(decode(step->input, &raw, *record->curve));
  return verify_digest(record->main, {}, record->message.data(), raw.view());
}

// create_ec_sign, create_ec_verify: begin an operation with KM_TAG_DIGEST of the request's
// parameters. -38: absent or repeated. -13: MD5. -12: no such digest. -1000: the platform refuses
// the key.
keymaster_error_t create_ec_sign(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<ec_sign_operation_t>(
      {ec_sign_free, ec_update, ec_sign_finish}, operation,
      [&](ec_operation_t* record) { return prepare(record, TEE_MODE_SIGN, request); });
}

keymaster_error_t create_ec_verify(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<ec_verify_operation_t>(
      {ec_verify_free, ec_update, ec_verify_finish}, operation,
      [&](ec_operation_t* record) { return prepare(record, TEE_MODE_VERIFY, request); });
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
  if (purpose == KM_PURPOSE_SIGN) return &EC_SIGN_METHODS;
  return purpose == KM_PURPOSE_VERIFY ? &EC_VERIFY_METHODS : nullptr;
}

}  // namespace

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
