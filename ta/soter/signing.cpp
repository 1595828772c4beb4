// Signatures over the documents of SOTER keys, with the operation of a sign command and with keys
// of their own; the hooks through which RSA signing comes here.
#include "ta/soter/signing.h"

#include "tee_extensions.h"

#include <algorithm>

#include "ta/alg/rsa/soter_hooks.h"
#include "ta/base/outcome.h"
#include "ta/soter/documents.h"
#include "ta/soter/provisioning.h"

namespace keymaster {
namespace {

constexpr size_t SHA256_SIZE = 32;
constexpr size_t USUAL_SIGNATURE = 256;  // of a 2048-bit key

// An operation without a hash is a raw private-key one, which cannot sign a digest: the platform
// must not even be asked. Intended: such keys fail here, after the counter has moved.
TEE_Result refuse_undigested(const rsa_sign_operation_t& operation, byte_view document) {
  const TEE_Result res =
      document.size() > operation.key_size() ? TEE_ERROR_OUT_OF_MEMORY : TEE_ERROR_BAD_STATE;
  return fail(res, "AsymmetricSignDigest failed with 0x%08x\n", res);
}

}  // namespace

uint64_t signed_document_size(byte_view document, byte_view signature) {
  return sizeof(uint32_t) + uint64_t{document.size()} + signature.size();
}

bool write_signed_document(byte_view document, byte_view signature, byte_span room) {
  output_cursor out(room);
  return out.write_field(document) && out.write_bytes(signature);
}

TEE_Result soter_do_sign_finish(rsa_sign_operation_t* operation, byte_view document,
                                heap_buffer* signature) {
  const trace_scope scope;
  message_t& message = operation->message;
  if (!message.is_hashed()) return refuse_undigested(*operation, document);
  TRY(message.hash.digest_final(document, message.buffer.span(), &message.length));
  heap_buffer made;
  if (!made.allocate(operation->key_size())) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  // The longest salt, whatever the digest: unlike other keys' signatures, intended.
  TRY(rsa_sign_digest(*operation, TEE_PSS_SALT_MAX_LENGTH, &made));
  *signature = std::move(made);
  return TEE_SUCCESS;
}

TEE_Result do_digest_with_sha(byte_view data, byte_span digest) {
  const trace_scope scope;
  tee_operation sha;
  TRY(sha.allocate(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0));
  size_t length = 0;
  return sha.digest_final(data, digest, &length);
}

TEE_Result do_sign_with_rsa(TEE_ObjectHandle key, uint32_t key_bits, byte_view digest,
                            heap_buffer* signature) {
  const trace_scope scope;
  tee_operation rsa;
  TRY(rsa.allocate(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN, key_bits));
  TRY(rsa.set_key(key));
  heap_buffer made;
  if (!made.allocate(std::max(USUAL_SIGNATURE, size_t{key_bits} / 8))) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  // The key may be a client's, and a platform need not answer for one that is too short.
  if (pkcs1_size(*find_digest(KM_DIGEST_SHA_2_256)) > key_bits / 8) {
    return checked(TEE_ERROR_BAD_PARAMETERS, "AsymmetricSignDigest");
  }
  TRY(sign_digest(rsa, {}, digest, &made));
  *signature = std::move(made);
  return TEE_SUCCESS;
}

TEE_Result digest_and_sign(TEE_ObjectHandle key, uint32_t key_bits, byte_view data,
                           heap_buffer* signature) {
  uint8_t digest[SHA256_SIZE];
  TRY(do_digest_with_sha(data, digest));
  return do_sign_with_rsa(key, key_bits, digest, signature);
}

TEE_Result soter_check_resources() {
  return soter_check_init();
}

TEE_Result soter_enhance_sign_finish(rsa_sign_operation_t* operation,
                                     const keymaster_key_param_set_t& key_params, byte_view message,
                                     heap_buffer* output) {
  const trace_scope scope;
  uint64_t uid = 0;
  if (const auto* given = get_unique(key_params, KM_TAG_SOTER_UID)) {
    trace(TEE_TRACE_DEBUG, "soter key has uid\n");
    uid = given->integer;
  }
  heap_buffer document;
  if (!produce_soter_sign_json(uid, message, &document)) {
    return fail(TEE_ERROR_GENERIC, "produce json string error");
  }
  heap_buffer signature;
  TRY(soter_do_sign_finish(operation, document.view(), &signature));
  const uint64_t size = signed_document_size(document.view(), signature.view());
  heap_buffer record;
  if (size > UINT32_MAX || !record.allocate(static_cast<size_t>(size)) ||
      !write_signed_document(document.view(), signature.view(), record.span())) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory for output");
  }
  *output = std::move(record);
  return TEE_SUCCESS;
}

}  // namespace keymaster
