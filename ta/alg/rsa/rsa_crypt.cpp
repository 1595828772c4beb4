// RSA encryption and decryption. All data comes through update; the limits of the paddings are
// enforced at finish.
#include "tee_internal_api.h"

#include "ta/alg/big_endian.h"
#include "ta/alg/rsa/rsa_operation.h"

namespace keymaster {
namespace {

// What the padding adds to a message at least, in bytes.
keymaster_error_t padding_overhead(const rsa_operation_t& operation, size_t* overhead) {
  *overhead = operation.padding == KM_PAD_RSA_PKCS1_1_5_ENCRYPT ? PKCS1_OVERHEAD : 0;
  if (operation.padding != KM_PAD_RSA_OAEP) return KM_ERROR_OK;
  const digest_t* digest = find_digest(operation.message.digest);
  if (digest == nullptr) {
    trace_error("Unknown digest %d", static_cast<int>(operation.message.digest));
    return KM_ERROR_INCOMPATIBLE_DIGEST;
  }
  *overhead = 2 * digest->size + 2;
  return KM_ERROR_OK;
}

keymaster_error_t check_message_length(const rsa_operation_t& operation) {
  size_t overhead = 0;
  if (auto error = padding_overhead(operation, &overhead)) return error;
  if (operation.message.length + overhead <= operation.key_size()) return KM_ERROR_OK;
  const int longest = static_cast<int>(operation.key_size()) - static_cast<int>(overhead);
  trace_error("Message too long, max %dB, got %dB", longest,
              static_cast<int>(operation.message.length));
  return KM_ERROR_INVALID_INPUT_LENGTH;
}

void rsa_encrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_encrypt_operation_t>(operation);
}

void rsa_decrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_decrypt_operation_t>(operation);
}

TEE_Result rsa_encrypt_update(operation_t* operation, const keymaster_key_param_set_t&,
                              byte_view input, size_t* consumed, byte_span, size_t* produced,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  *produced = 0;
  return rsa_keep(static_cast<rsa_encrypt_operation_t*>(operation), input, 0, "encrypt", consumed,
                  km_error);
}

TEE_Result rsa_decrypt_update(operation_t* operation, const keymaster_key_param_set_t&,
                              byte_view input, size_t* consumed, byte_span, size_t* produced,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  *produced = 0;
  return rsa_keep(static_cast<rsa_decrypt_operation_t*>(operation), input, 0, "decrypt", consumed,
                  km_error);
}

TEE_Result rsa_encrypt_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                              heap_buffer* output, keymaster_key_param_set_t*,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  const auto* record = static_cast<rsa_encrypt_operation_t*>(operation);
  *km_error = check_message_length(*record);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer ciphertext;
  size_t size = 0;
  TEE_Result res = rsa_crypt(TEE_AsymmetricEncrypt, *record, record->message.data(), &ciphertext,
                             &size, km_error);
  res = rsa_settle_crypt(res, "TEE_AsymmetricEncrypt failed with", km_error);
  if (failed(res, *km_error)) return res;
  right_align(ciphertext.span(), size);
  *output = std::move(ciphertext);
  return TEE_SUCCESS;
}

TEE_Result rsa_decrypt_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                              heap_buffer* output, keymaster_key_param_set_t*,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  const auto* record = static_cast<rsa_decrypt_operation_t*>(operation);
  heap_buffer plaintext;
  size_t size = 0;
  TEE_Result res = rsa_crypt(TEE_AsymmetricDecrypt, *record, record->message.data(), &plaintext,
                             &size, km_error);
  res = rsa_settle_crypt(res, "TEE_AsymmetricDecrypt failed with", km_error);
  if (failed(res, *km_error)) return res;
  if (record->padding == KM_PAD_NONE) {
    right_align(plaintext.span(), size);
  } else {
    plaintext.truncate(size);
  }
  *output = std::move(plaintext);
  return TEE_SUCCESS;
}

}  // namespace

operation_t* create_rsa_encrypt(byte_view key_material, const keymaster_key_param_set_t&,
                                const keymaster_key_param_set_t& begin_params,
                                keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<rsa_encrypt_operation_t>(
      {rsa_encrypt_free, rsa_encrypt_update, rsa_encrypt_finish}, km_error,
      [&](rsa_encrypt_operation_t* operation) {
        return rsa_prepare(operation, RSA_ENCRYPT, key_material, begin_params, km_error);
      });
}

operation_t* create_rsa_decrypt(byte_view key_material, const keymaster_key_param_set_t&,
                                const keymaster_key_param_set_t& begin_params,
                                keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<rsa_decrypt_operation_t>(
      {rsa_decrypt_free, rsa_decrypt_update, rsa_decrypt_finish}, km_error,
      [&](rsa_decrypt_operation_t* operation) {
        return rsa_prepare(operation, RSA_DECRYPT, key_material, begin_params, km_error);
      });
}

}  // namespace keymaster
