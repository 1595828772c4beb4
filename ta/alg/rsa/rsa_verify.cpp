// RSA verification.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include "ta/alg/rsa/rsa_operation.h"

namespace keymaster {
namespace {

// The salt may have any length, unlike in signing: intended, so that standard signatures verify
// whatever their salt.
TEE_Result verify_hashed(rsa_verify_operation_t* operation, byte_view signature,
                         keymaster_error_t* km_error) {
  if (TEE_Result res = operation->message.finish_hash()) return res;
  const TEE_Attribute salt = value_attribute(TEE_ATTR_RSA_PSS_SALT_LENGTH, TEE_PSS_SALT_MAX_LENGTH);
  const size_t count = operation->padding == KM_PAD_RSA_PSS ? 1 : 0;
  return verify_digest(operation->main, {&salt, count}, operation->message.data(), signature,
                       km_error);
}

// The public-key operation, and the comparison with the expected block. Its first byte is 0, which
// the platform leaves out. Without padding the data is compared as it came, at the front of the
// block and not at its end as in signing: intended.
TEE_Result verify_raw(rsa_verify_operation_t* operation, byte_view signature,
                      keymaster_error_t* km_error) {
  if (operation->padding == KM_PAD_RSA_PKCS1_1_5_SIGN) rsa_build_pkcs1_block(operation);
  heap_buffer found;
  size_t size = 0;
  const TEE_Result res =
      rsa_crypt(TEE_AsymmetricEncrypt, *operation, signature, &found, &size, km_error);
  if (res != TEE_SUCCESS) {
    trace_error("AsymmetricEncrypt failed with 0x%08x\n", res);
    return res;
  }
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  const byte_view expected = operation->message.buffer.view().subspan(1);
  if (!equal_constant_time(found.view().first(size), expected)) {
    *km_error = KM_ERROR_VERIFICATION_FAILED;
  }
  return TEE_SUCCESS;
}

void rsa_verify_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<rsa_verify_operation_t>(operation);
}

TEE_Result rsa_verify_update(operation_t* operation, const keymaster_key_param_set_t&,
                             byte_view input, size_t* consumed, byte_span, size_t* produced,
                             keymaster_error_t* km_error) {
  const trace_scope scope;
  *produced = 0;
  return rsa_take_signed(static_cast<rsa_verify_operation_t*>(operation), input, "verify", consumed,
                         km_error);
}

// The data of finish is the signature; all that it signs comes through update.
TEE_Result rsa_verify_finish(operation_t* operation, const keymaster_key_param_set_t&,
                             byte_view signature, heap_buffer*, keymaster_key_param_set_t*,
                             keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<rsa_verify_operation_t*>(operation);
  return record->message.is_hashed() ? verify_hashed(record, signature, km_error)
                                     : verify_raw(record, signature, km_error);
}

}  // namespace

operation_t* create_rsa_verify(byte_view key_material, const keymaster_key_param_set_t&,
                               const keymaster_key_param_set_t& begin_params,
                               keymaster_key_param_set_t*, keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<rsa_verify_operation_t>(
      {rsa_verify_free, rsa_verify_update, rsa_verify_finish}, km_error,
      [&](rsa_verify_operation_t* operation) {
        return rsa_prepare(operation, RSA_VERIFY, key_material, begin_params, km_error);
      });
}

}  // namespace keymaster
