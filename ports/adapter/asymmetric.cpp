// RSA operations: salt codes, PSS with any salt, and raw results without leading zeros.
#include <algorithm>

#include "ports/adapter/operations.h"
#include "ports/adapter/pss.h"
#include "ta/alg/big_endian.h"

namespace keymaster::adapter {
namespace {

using attributes_t = std::span<const TEE_Attribute>;

// The length that the salt code of a request stands for under the operation's key. The longest
// salt also stands for a length that does not fit, so that the platform is never asked for one.
size_t salt_length(const known_operation& operation, attributes_t given) {
  const size_t digest_size = pss_digest_size(operation.digest);
  const auto code =
      std::ranges::find(given, uint32_t{TEE_ATTR_RSA_PSS_SALT_LENGTH}, &TEE_Attribute::attributeID);
  uint32_t wanted = TEE_PSS_SALT_DIGEST_LENGTH;
  if (code != given.end()) wanted = code->content.value.a;
  if (wanted == TEE_PSS_SALT_DIGEST_LENGTH) wanted = static_cast<uint32_t>(digest_size);
  return std::min(size_t{wanted}, pss_longest_salt(operation.modulus.view(), digest_size));
}

// Standard platforms differ in whether a raw result has its leading zeros; the trusted application
// wants the number without them, and one byte for 0.
void strip_if_raw(TEE_OperationHandle operation, void* data, tee_size* length) {
  const known_operation* known = find_operation(operation);
  if (known == nullptr || known->purpose != role::RAW) return;
  const byte_span result(static_cast<uint8_t*>(data), *length);
  byte_view number = without_leading_zeros(result);
  if (number.empty() && !result.empty()) number = result.last(1);
  copy_bytes(result, number);
  *length = static_cast<tee_size>(number.size());
}

// The raw public operation on a signature, right-aligned in `block`, which is as long as the
// modulus. A signature that is no number below the modulus is a bad one.
TEE_Result open_signature(TEE_OperationHandle handle, byte_view signature, byte_span block) {
  auto size = static_cast<tee_size>(block.size());
  const TEE_Result res =
      platform_encrypt(handle, nullptr, 0, signature.data(),
                       static_cast<tee_size>(signature.size()), block.data(), &size);
  if (res == TEE_ERROR_BAD_PARAMETERS) return TEE_ERROR_SIGNATURE_INVALID;
  if (res == TEE_SUCCESS) right_align(block, size);
  return res;
}

TEE_Result verify_pss(const known_operation& operation, byte_view hash, byte_view signature) {
  const byte_view modulus = operation.modulus.view();
  if (signature.size() != modulus.size()) return TEE_ERROR_SIGNATURE_INVALID;
  heap_buffer block;
  if (!block.allocate(modulus.size())) return TEE_ERROR_OUT_OF_MEMORY;
  if (TEE_Result res = open_signature(operation.handle, signature, block.span())) return res;
  return pss_verify(operation.digest, modulus, hash, block.span());
}

byte_view bytes_of(const void* data, tee_size length) {
  return {static_cast<const uint8_t*>(data), length};
}

}  // namespace

extern "C" TEE_Result wrapped_encrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                      uint32_t count, const void* input, tee_size input_length,
                                      void* output, tee_size* output_length)
    ADAPTER_WRAPPED(TEE_AsymmetricEncrypt);
TEE_Result wrapped_encrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                           uint32_t count, const void* input, tee_size input_length, void* output,
                           tee_size* output_length) {
  const TEE_Result res =
      platform_encrypt(operation, params, count, input, input_length, output, output_length);
  if (res == TEE_SUCCESS) strip_if_raw(operation, output, output_length);
  return res;
}

extern "C" TEE_Result wrapped_decrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                      uint32_t count, const void* input, tee_size input_length,
                                      void* output, tee_size* output_length)
    ADAPTER_WRAPPED(TEE_AsymmetricDecrypt);
TEE_Result wrapped_decrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                           uint32_t count, const void* input, tee_size input_length, void* output,
                           tee_size* output_length) {
  const TEE_Result res =
      platform_decrypt(operation, params, count, input, input_length, output, output_length);
  if (res == TEE_SUCCESS) strip_if_raw(operation, output, output_length);
  return res;
}

extern "C" TEE_Result wrapped_sign_digest(TEE_OperationHandle operation,
                                          const TEE_Attribute* params, uint32_t count,
                                          const void* digest, tee_size digest_length,
                                          void* signature, tee_size* signature_length)
    ADAPTER_WRAPPED(TEE_AsymmetricSignDigest);
TEE_Result wrapped_sign_digest(TEE_OperationHandle operation, const TEE_Attribute* params,
                               uint32_t count, const void* digest, tee_size digest_length,
                               void* signature, tee_size* signature_length) {
  const known_operation* known = find_operation(operation);
  TEE_Attribute salt{};
  if (known != nullptr && known->purpose == role::PSS_SIGN) {
    const size_t length = salt_length(*known, {params, count});
    TEE_InitValueAttribute(&salt, TEE_ATTR_RSA_PSS_SALT_LENGTH, static_cast<uint32_t>(length), 0);
    params = &salt;
    count = 1;
  }
  return platform_sign_digest(operation, params, count, digest, digest_length, signature,
                              signature_length);
}

extern "C" TEE_Result wrapped_verify_digest(TEE_OperationHandle operation,
                                            const TEE_Attribute* params, uint32_t count,
                                            const void* digest, tee_size digest_length,
                                            const void* signature, tee_size signature_length)
    ADAPTER_WRAPPED(TEE_AsymmetricVerifyDigest);
TEE_Result wrapped_verify_digest(TEE_OperationHandle operation, const TEE_Attribute* params,
                                 uint32_t count, const void* digest, tee_size digest_length,
                                 const void* signature, tee_size signature_length) {
  const known_operation* known = find_operation(operation);
  if (known == nullptr || known->purpose != role::PSS_VERIFY) {
    return platform_verify_digest(operation, params, count, digest, digest_length, signature,
                                  signature_length);
  }
  return verify_pss(*known, bytes_of(digest, digest_length), bytes_of(signature, signature_length));
}

}  // namespace keymaster::adapter
