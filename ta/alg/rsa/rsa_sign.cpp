// RSA signing, and the SOTER keys whose message is kept whole.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/alg/rsa/soter_hooks.h"

namespace keymaster {
namespace {

constexpr size_t FIRST_SOTER_CAPACITY = 4096;

TEE_Result start_soter(rsa_sign_operation_t* operation, keymaster_error_t* km_error) {
  trace(TEE_TRACE_DEBUG, "sign from soter, allocate raw message buffer");
  if (TEE_Result res = soter_check_resources()) {
    trace_error("soter resources is not ready, error 0x%x\n", res);
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  } else if (!operation->soter_message.allocate(FIRST_SOTER_CAPACITY)) {
    trace_error("No memory for soter");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

// Makes room for `needed` bytes, at least doubling what there was.
keymaster_error_t expand_soter_message(rsa_sign_operation_t* operation, uint64_t needed) {
  heap_buffer& held = operation->soter_message;
  const uint64_t capacity = std::max(needed, 2 * uint64_t{held.size()});
  heap_buffer larger;
  if (capacity > UINT32_MAX || !larger.allocate(static_cast<size_t>(capacity))) {
    trace_error("no memory to expand soter buf %u", static_cast<unsigned>(capacity));
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  copy_bytes(larger.span(), held.view().first(operation->soter_length));
  trace(TEE_TRACE_DEBUG, "expand soter buf %u -> %d", static_cast<unsigned>(held.size()),
        static_cast<int>(capacity));
  held = std::move(larger);
  return KM_ERROR_OK;
}

TEE_Result update_soter(rsa_sign_operation_t* operation, byte_view input, size_t* consumed,
                        keymaster_error_t* km_error) {
  trace(TEE_TRACE_DEBUG, "sign update is from soter");
  *consumed = 0;
  const uint64_t needed = uint64_t{operation->soter_length} + input.size();
  if (needed > operation->soter_message.size()) {
    *km_error = expand_soter_message(operation, needed);
    if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  }
  copy_bytes(operation->soter_message.span().subspan(operation->soter_length), input);
  operation->soter_length += input.size();
  *consumed = input.size();
  return TEE_SUCCESS;
}

TEE_Result finish_soter(rsa_sign_operation_t* operation, heap_buffer* output,
                        keymaster_error_t* km_error) {
  trace(TEE_TRACE_DEBUG, "sign finish is from soter");
  const byte_view message = operation->soter_message.view().first(operation->soter_length);
  if (TEE_Result res =
          soter_enhance_sign_finish(operation, operation->key_characteristics, message, output)) {
    trace_error("soter enhance error %x", res);
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

// A salt as long as the digest where it fits easily, else the longest that fits.
uint32_t salt_length(const rsa_sign_operation_t& operation) {
  const bool fits = (operation.message.length + 1) * 2 <= operation.key_size();
  return fits ? TEE_PSS_SALT_DIGEST_LENGTH : TEE_PSS_SALT_MAX_LENGTH;
}

TEE_Result sign_hashed(rsa_sign_operation_t* operation, heap_buffer* signature,
                       keymaster_error_t* km_error) {
  if (TEE_Result res = operation->message.finish_hash()) return res;
  if (!signature->allocate(operation->key_size())) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Attribute salt = value_attribute(TEE_ATTR_RSA_PSS_SALT_LENGTH, salt_length(*operation));
  const size_t count = operation->padding == KM_PAD_RSA_PSS ? 1 : 0;
  return sign_digest(operation->main, {&salt, count}, operation->message.data(), signature);
}

// The private-key operation on a block that is built here.
TEE_Result sign_raw(rsa_sign_operation_t* operation, heap_buffer* signature,
                    keymaster_error_t* km_error) {
  const byte_span block = operation->message.buffer.span();
  if (operation->padding == KM_PAD_RSA_PKCS1_1_5_SIGN) {
    rsa_build_pkcs1_block(operation);
  } else {
    right_align(block, operation->message.length);
  }
  size_t size = 0;
  TEE_Result res = rsa_crypt(TEE_AsymmetricDecrypt, *operation, block, signature, &size, km_error);
  res = rsa_settle_crypt(res, "TEE_AsymmetricDecrypt return", km_error);
  if (!failed(res, *km_error)) right_align(signature->span(), size);
  return res;
}

void rsa_sign_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_sign_operation_t>(operation);
}

TEE_Result rsa_sign_update(operation_t* operation, const keymaster_key_param_set_t&,
                           byte_view input, size_t* consumed, byte_span, size_t* produced,
                           keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<rsa_sign_operation_t*>(operation);
  *produced = 0;
  if (record->soter_message) {
    return update_soter(record, input, consumed, km_error);
  }
  return rsa_take_signed(record, input, "sign", consumed, km_error);
}

TEE_Result rsa_sign_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                           heap_buffer* output, keymaster_key_param_set_t*,
                           keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<rsa_sign_operation_t*>(operation);
  if (record->soter_message) return finish_soter(record, output, km_error);
  heap_buffer signature;
  const TEE_Result res = record->message.is_hashed() ? sign_hashed(record, &signature, km_error)
                                                     : sign_raw(record, &signature, km_error);
  if (!failed(res, *km_error)) *output = std::move(signature);
  return res;
}

}  // namespace

operation_t* create_rsa_sign(byte_view key_material,
                             const keymaster_key_param_set_t& key_characteristics,
                             const keymaster_key_param_set_t& begin_params,
                             keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<rsa_sign_operation_t>(
      {rsa_sign_free, rsa_sign_update, rsa_sign_finish}, km_error,
      [&](rsa_sign_operation_t* operation) {
        if (contains_tag(key_characteristics, KM_TAG_SOTER_KEY)) {
          const TEE_Result res = start_soter(operation, km_error);
          if (failed(res, *km_error)) return res;
        }
        return rsa_prepare(operation, RSA_SIGN, key_material, begin_params, km_error);
      });
}

}  // namespace keymaster
