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
    return refuse(KM_ERROR_INCOMPATIBLE_DIGEST, "Unknown digest %d",
                  static_cast<int>(operation.message.digest));
  }
  *overhead = 2 * digest->size + 2;
  return KM_ERROR_OK;
}

keymaster_error_t check_message_length(const rsa_operation_t& operation) {
  size_t overhead = 0;
  TRY(padding_overhead(operation, &overhead));
  if (operation.message.length + overhead <= operation.key_size()) return KM_ERROR_OK;
  const int longest = static_cast<int>(operation.key_size()) - static_cast<int>(overhead);
  return refuse(KM_ERROR_INVALID_INPUT_LENGTH, "Message too long, max %dB, got %dB", longest,
                static_cast<int>(operation.message.length));
}

void rsa_encrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_encrypt_operation_t>(operation);
}

void rsa_decrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_decrypt_operation_t>(operation);
}

outcome rsa_encrypt_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  return rsa_take(operation, step, "encrypt");
}

outcome rsa_decrypt_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  return rsa_take(operation, step, "decrypt");
}

outcome rsa_encrypt_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  const auto* record = static_cast<rsa_encrypt_operation_t*>(operation);
  TRY(check_message_length(*record));
  heap_buffer ciphertext;
  size_t size = 0;
  TRY(rsa_settle_crypt(
      rsa_crypt(TEE_AsymmetricEncrypt, *record, record->message.data(), &ciphertext, &size),
      "TEE_AsymmetricEncrypt failed with"));
  right_align(ciphertext.span(), size);
  step->output = std::move(ciphertext);
  return DONE;
}

outcome rsa_decrypt_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  const auto* record = static_cast<rsa_decrypt_operation_t*>(operation);
  heap_buffer plaintext;
  size_t size = 0;
  TRY(rsa_settle_crypt(
      rsa_crypt(TEE_AsymmetricDecrypt, *record, record->message.data(), &plaintext, &size),
      "TEE_AsymmetricDecrypt failed with"));
  if (record->padding == KM_PAD_NONE) {
    right_align(plaintext.span(), size);
  } else {
    plaintext.truncate(size);
  }
  step->output = std::move(plaintext);
  return DONE;
}

}  // namespace

keymaster_error_t create_rsa_encrypt(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<rsa_encrypt_operation_t>(
      {rsa_encrypt_free, rsa_encrypt_update, rsa_encrypt_finish}, operation,
      [&](rsa_operation_t* record) { return rsa_prepare(record, RSA_ENCRYPT, request); });
}

keymaster_error_t create_rsa_decrypt(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<rsa_decrypt_operation_t>(
      {rsa_decrypt_free, rsa_decrypt_update, rsa_decrypt_finish}, operation,
      [&](rsa_operation_t* record) { return rsa_prepare(record, RSA_DECRYPT, request); });
}

}  // namespace keymaster
