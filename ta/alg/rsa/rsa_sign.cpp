// RSA signing, and the SOTER keys whose message is kept whole.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/alg/rsa/soter_hooks.h"

namespace keymaster {
namespace {

constexpr size_t FIRST_SOTER_CAPACITY = 4096;

keymaster_error_t start_soter(rsa_sign_operation_t* operation) {
  trace(TEE_TRACE_DEBUG, "sign from soter, allocate raw message buffer");
  if (TEE_Result res = soter_check_resources()) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "soter resources is not ready, error 0x%x", res);
  }
  if (!operation->soter_message.allocate(FIRST_SOTER_CAPACITY)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "No memory for soter");
  }
  return KM_ERROR_OK;
}

// Makes room for `needed` bytes, at least doubling what there was.
keymaster_error_t expand_soter_message(rsa_sign_operation_t* operation, uint64_t needed) {
  heap_buffer& held = operation->soter_message;
  const uint64_t capacity = std::max(needed, 2 * uint64_t{held.size()});
  heap_buffer larger;
  if (capacity > UINT32_MAX || !larger.allocate(static_cast<size_t>(capacity))) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "no memory to expand soter buf %u",
                  static_cast<unsigned>(capacity));
  }
  copy_bytes(larger.span(), held.view().first(operation->soter_length));
  trace(TEE_TRACE_DEBUG, "expand soter buf %u -> %d", static_cast<unsigned>(held.size()),
        static_cast<int>(capacity));
  held = std::move(larger);
  return KM_ERROR_OK;
}

keymaster_error_t update_soter(rsa_sign_operation_t* operation, update_step* step) {
  trace(TEE_TRACE_DEBUG, "sign update is from soter");
  const uint64_t needed = uint64_t{operation->soter_length} + step->input.size();
  if (needed > operation->soter_message.size()) TRY(expand_soter_message(operation, needed));
  copy_bytes(operation->soter_message.span().subspan(operation->soter_length), step->input);
  operation->soter_length += step->input.size();
  step->consumed = step->input.size();
  return KM_ERROR_OK;
}

keymaster_error_t finish_soter(rsa_sign_operation_t* operation, heap_buffer* output) {
  trace(TEE_TRACE_DEBUG, "sign finish is from soter");
  const byte_view message = operation->soter_message.view().first(operation->soter_length);
  if (TEE_Result res =
          soter_enhance_sign_finish(operation, operation->key_characteristics, message, output)) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "soter enhance error %x", res);
  }
  return KM_ERROR_OK;
}

// A salt as long as the digest where it fits easily, else the longest that fits.
uint32_t salt_length(const rsa_sign_operation_t& operation) {
  const bool fits = (operation.message.length + 1) * 2 <= operation.key_size();
  return fits ? TEE_PSS_SALT_DIGEST_LENGTH : TEE_PSS_SALT_MAX_LENGTH;
}

// Whether the platform can build the block of a signature with this salt.
bool fits(const rsa_operation_t& operation, uint32_t salt) {
  const digest_t& digest = *find_digest(operation.message.digest);
  if (operation.padding != KM_PAD_RSA_PSS) return pkcs1_size(digest) <= operation.key_size();
  // A PSS block has a bit less than the modulus, which may be a whole byte (RFC 8017, 8.1.1).
  const size_t block = (size_t{operation.modulus_bits} + 6) / 8;
  const size_t salt_size = salt == TEE_PSS_SALT_DIGEST_LENGTH ? digest.size : 0;
  return digest.size + salt_size + 2 <= block;
}

outcome sign_hashed(rsa_sign_operation_t* operation, heap_buffer* signature) {
  TRY(operation->message.finish_hash());
  if (!signature->allocate(operation->key_size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return rsa_sign_digest(*operation, salt_length(*operation), signature);
}

// The private-key operation on a block that is built here.
outcome sign_raw(rsa_sign_operation_t* operation, heap_buffer* signature) {
  const byte_span block = operation->message.buffer.span();
  if (operation->padding == KM_PAD_RSA_PKCS1_1_5_SIGN) {
    rsa_build_pkcs1_block(operation);
  } else {
    right_align(block, operation->message.length);
  }
  size_t size = 0;
  TRY(rsa_settle_crypt(rsa_crypt(TEE_AsymmetricDecrypt, *operation, block, signature, &size),
                       "TEE_AsymmetricDecrypt return"));
  right_align(signature->span(), size);
  return DONE;
}

void rsa_sign_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_sign_operation_t>(operation);
}

outcome rsa_sign_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  auto* record = static_cast<rsa_sign_operation_t*>(operation);
  return record->soter_message ? update_soter(record, step) : rsa_take(record, step, "sign");
}

outcome rsa_sign_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<rsa_sign_operation_t*>(operation);
  if (record->soter_message) return finish_soter(record, &step->output);
  heap_buffer signature;
  TRY(record->message.is_hashed() ? sign_hashed(record, &signature) : sign_raw(record, &signature));
  step->output = std::move(signature);
  return DONE;
}

}  // namespace

size_t pkcs1_size(const digest_t& digest) {
  return PKCS1_OVERHEAD + digest.info_size + digest.size;
}

TEE_Result rsa_sign_digest(const rsa_operation_t& operation, uint32_t salt,
                           heap_buffer* signature) {
  if (!fits(operation, salt)) return checked(TEE_ERROR_BAD_PARAMETERS, "AsymmetricSignDigest");
  const TEE_Attribute length = value_attribute(TEE_ATTR_RSA_PSS_SALT_LENGTH, salt);
  const size_t count = operation.padding == KM_PAD_RSA_PSS ? 1 : 0;
  return sign_digest(operation.main, {&length, count}, operation.message.data(), signature);
}

keymaster_error_t create_rsa_sign(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<rsa_sign_operation_t>(
      {rsa_sign_free, rsa_sign_update, rsa_sign_finish}, operation,
      [&](rsa_sign_operation_t* record) -> outcome {
        if (contains_tag(request.key_characteristics, KM_TAG_SOTER_KEY)) TRY(start_soter(record));
        return rsa_prepare(record, RSA_SIGN, request);
      });
}

}  // namespace keymaster
