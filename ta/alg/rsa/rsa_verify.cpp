// RSA verification.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include "ta/alg/rsa/rsa_operation.h"

namespace keymaster {
namespace {

// The salt may have any length, unlike in signing: intended, so that standard signatures verify
// whatever their salt.
outcome verify_hashed(rsa_verify_operation_t* operation, byte_view signature) {
  TRY(operation->message.finish_hash());
  const TEE_Attribute salt = value_attribute(TEE_ATTR_RSA_PSS_SALT_LENGTH, TEE_PSS_SALT_MAX_LENGTH);
  const size_t count = operation->padding == KM_PAD_RSA_PSS ? 1 : 0;
  return verify_digest(operation->main, {&salt, count}, operation->message.data(), signature);
}

// The public-key operation, and the comparison with the expected block. Its first byte is 0, which
// the platform leaves out. Without padding the data is compared as it came, at the front of the
// block and not at its end as in signing: intended.
outcome verify_raw(rsa_verify_operation_t* operation, byte_view signature) {
  if (operation->padding == KM_PAD_RSA_PKCS1_1_5_SIGN) rsa_build_pkcs1_block(operation);
  heap_buffer found;
  size_t size = 0;
  const outcome how = rsa_crypt(TEE_AsymmetricEncrypt, *operation, signature, &found, &size);
  TRY(checked(how.tee, "AsymmetricEncrypt"));
  TRY(how);
  const byte_view expected = operation->message.buffer.view().subspan(1);
  const bool same = equal_constant_time(found.view().first(size), expected);
  return same ? KM_ERROR_OK : KM_ERROR_VERIFICATION_FAILED;
}

void rsa_verify_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_verify_operation_t>(operation);
}

outcome rsa_verify_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  return rsa_take(operation, step, "verify");
}

// The data of finish is the signature; all that it signs comes through update.
outcome rsa_verify_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<rsa_verify_operation_t*>(operation);
  return record->message.is_hashed() ? verify_hashed(record, step->input)
                                     : verify_raw(record, step->input);
}

}  // namespace

keymaster_error_t create_rsa_verify(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<rsa_verify_operation_t>(
      {rsa_verify_free, rsa_verify_update, rsa_verify_finish}, operation,
      [&](rsa_operation_t* record) { return rsa_prepare(record, RSA_VERIFY, request); });
}

}  // namespace keymaster
