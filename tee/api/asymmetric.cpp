// Asymmetric operations: one call each, with no state between calls.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <algorithm>
#include <cstring>

#include "tee/api/arguments.h"
#include "tee/api/operations.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/profile.h"
#include "tee/crypto/ecdsa.h"
#include "tee/crypto/fetched.h"
#include "tee/crypto/rsa.h"

using tee::current_profile;
using tee::fault_point;
using tee::guarded;
using tee::input_bytes;
using tee::operation;
using tee::output_buffer;
using tee::panic;
using tee::crypto::family;
using tee::crypto::rsa_padding;

namespace {

using parameters = std::span<const TEE_Attribute>;

// Whether an operation with that padding takes the parameter. Others are ignored, except by a
// strict platform.
bool is_known(rsa_padding padding, uint32_t attribute) {
  switch (attribute) {
    case TEE_ATTR_RSA_PSS_SALT_LENGTH:
      return padding == rsa_padding::PSS;
    case TEE_ATTR_RSA_OAEP_LABEL:
    case TEE_ATTR_RSA_OAEP_MGF_HASH:
      return padding == rsa_padding::OAEP;
    default:
      return false;
  }
}

parameters checked(const char* call, const operation& op, const TEE_Attribute* params,
                   uint32_t count) {
  if (!params && count > 0) panic(call, "params are null with count %u", count);
  if (!current_profile().strict) return {params, count};
  for (const TEE_Attribute& given : parameters(params, count)) {
    if (!is_known(op.algorithm.padding, given.attributeID)) {
      panic(call, "parameter 0x%08x is unknown to the algorithm", given.attributeID);
    }
  }
  return {params, count};
}

// The operation behind a handle, for signatures: RSA or ECDSA with a key.
operation& signature_operation_of(const char* call, TEE_OperationHandle handle, uint32_t mode) {
  auto& found = tee::current_instance(call).operations().get(handle, call);
  bool ecdsa = found.algorithm.kind == family::ECDSA;
  tee::keyed_operation_of(call, handle, ecdsa ? family::ECDSA : family::RSA_SIGNATURE);
  tee::require_mode(call, found, mode);
  return found;
}

// An algorithm that names its digest takes nothing but one of that length.
void check_digest_length(const char* call, const operation& op, size_t length) {
  if (op.algorithm.digest == tee::crypto::hash::NONE) return;
  size_t expected = tee::crypto::length_of(op.algorithm.digest);
  if (length != expected) panic(call, "a digest of %zu bytes, not %zu", length, expected);
}

// To the standard, codes are no lengths.
tee::crypto::pss_salt salt_of(parameters params) {
  constexpr uint32_t LONGEST = INT32_MAX;
  for (const TEE_Attribute& given : params) {
    if (given.attributeID != TEE_ATTR_RSA_PSS_SALT_LENGTH) continue;
    const uint32_t length = given.content.value.a;
    if (length < LONGEST || tee::current_profile().extensions) return length;
  }
  return std::nullopt;
}

// Raw results as the standard's platforms give them: as long as the modulus.
void widen_raw(const operation& op, tee::secret_bytes* result) {
  if (op.algorithm.padding != rsa_padding::NONE || tee::current_profile().extensions) return;
  result->insert(result->begin(), tee::crypto::modulus_length(*op.key) - result->size(), 0);
}

// The room to ask for before encrypting; 0 where the length is only known afterwards.
size_t known_length(const operation& op) {
  bool raw = op.algorithm.padding == rsa_padding::NONE;
  bool fixed = op.mode == TEE_MODE_ENCRYPT && !raw;
  return fixed ? tee::crypto::modulus_length(*op.key) : 0;
}

// TEE_ERROR_NOT_SUPPORTED for a digest that the platform does not have.
TEE_Result oaep_of(const char* call, parameters params, tee::crypto::oaep_options* options) {
  for (const TEE_Attribute& given : params) {
    const auto& [buffer, length] = given.content.ref;
    if (given.attributeID == TEE_ATTR_RSA_OAEP_LABEL) {
      options->label = input_bytes(call, "the label", buffer, length);
    } else if (given.attributeID == TEE_ATTR_RSA_OAEP_MGF_HASH) {
      uint32_t id = 0;
      if (!buffer || length != sizeof(id)) panic(call, "the digest of MGF1 is no identifier");
      std::memcpy(&id, buffer, sizeof(id));
      const auto* row = tee::crypto::find_algorithm(id);
      if (!row || row->kind != family::DIGEST) return TEE_ERROR_NOT_SUPPORTED;
      options->mask_digest = row->digest;
    }
  }
  return TEE_SUCCESS;
}

// TEE_AsymmetricEncrypt and TEE_AsymmetricDecrypt. A result that does not fit is not handed out,
// and the call can be made again.
TEE_Result crypt(const char* call, operation& op, parameters params, std::span<const uint8_t> input,
                 output_buffer output) {
  tee::crypto::oaep_options oaep;
  if (TEE_Result fault = fault_point()) return fault;
  if (TEE_Result res = oaep_of(call, params, &oaep)) return res;
  if (output.capacity() < known_length(op)) return output.reserve(known_length(op));
  auto run = op.mode == TEE_MODE_ENCRYPT ? tee::crypto::rsa_encrypt : tee::crypto::rsa_decrypt;
  tee::secret_bytes result;
  if (TEE_Result res = run(*op.key, op.algorithm, oaep, input, &result)) return res;
  widen_raw(op, &result);
  tee::require_apart(call, input, output.data(), std::min(result.size(), output.capacity()),
                     tee::same_place::ALLOWED);
  return output.fill(result);
}

operation& encryption_of(const char* call, TEE_OperationHandle handle, uint32_t mode) {
  auto& op = tee::keyed_operation_of(call, handle, family::RSA_ENCRYPTION);
  tee::require_mode(call, op, mode);
  return op;
}

}  // namespace

TEE_Result TEE_AsymmetricEncrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                 uint32_t paramCount, const void* srcData, size_t srcLen,
                                 void* destData, size_t* destLen) {
  constexpr const char* CALL = "TEE_AsymmetricEncrypt";
  return guarded(CALL, [&] {
    auto& op = encryption_of(CALL, operation, TEE_MODE_ENCRYPT);
    return crypt(CALL, op, checked(CALL, op, params, paramCount),
                 input_bytes(CALL, "srcData", srcData, srcLen),
                 output_buffer(CALL, "destData", destData, destLen));
  });
}

TEE_Result TEE_AsymmetricDecrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                 uint32_t paramCount, const void* srcData, size_t srcLen,
                                 void* destData, size_t* destLen) {
  constexpr const char* CALL = "TEE_AsymmetricDecrypt";
  return guarded(CALL, [&] {
    auto& op = encryption_of(CALL, operation, TEE_MODE_DECRYPT);
    return crypt(CALL, op, checked(CALL, op, params, paramCount),
                 input_bytes(CALL, "srcData", srcData, srcLen),
                 output_buffer(CALL, "destData", destData, destLen));
  });
}

TEE_Result TEE_AsymmetricSignDigest(TEE_OperationHandle operation, const TEE_Attribute* params,
                                    uint32_t paramCount, const void* digest, size_t digestLen,
                                    void* signature, size_t* signatureLen) {
  constexpr const char* CALL = "TEE_AsymmetricSignDigest";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = signature_operation_of(CALL, operation, TEE_MODE_SIGN);
    auto given = checked(CALL, op, params, paramCount);
    auto input = input_bytes(CALL, "digest", digest, digestLen);
    output_buffer output(CALL, "signature", signature, signatureLen);
    check_digest_length(CALL, op, digestLen);
    if (TEE_Result fault = fault_point()) return fault;
    bool ecdsa = op.algorithm.kind == family::ECDSA;
    size_t length =
        ecdsa ? tee::crypto::signature_length(*op.key) : tee::crypto::modulus_length(*op.key);
    if (TEE_Result res = output.reserve(length)) return res;
    TEE_Result res =
        ecdsa ? tee::crypto::ecdsa_sign(*op.key, input, output.data())
              : tee::crypto::rsa_sign(*op.key, op.algorithm, salt_of(given), input, output.data());
    if (res == TEE_SUCCESS) output.set_length(length);
    // The call's results tell of the buffer alone.
    if (res != TEE_SUCCESS && current_profile().strict) panic(CALL, "the key cannot sign that");
    return res;
  });
}

TEE_Result TEE_AsymmetricVerifyDigest(TEE_OperationHandle operation, const TEE_Attribute* params,
                                      uint32_t paramCount, const void* digest, size_t digestLen,
                                      const void* signature, size_t signatureLen) {
  constexpr const char* CALL = "TEE_AsymmetricVerifyDigest";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = signature_operation_of(CALL, operation, TEE_MODE_VERIFY);
    auto given = checked(CALL, op, params, paramCount);
    auto input = input_bytes(CALL, "digest", digest, digestLen);
    auto signed_bytes = input_bytes(CALL, "signature", signature, signatureLen);
    check_digest_length(CALL, op, digestLen);
    if (TEE_Result fault = fault_point()) return fault;
    bool good =
        op.algorithm.kind == family::ECDSA
            ? tee::crypto::ecdsa_verify(*op.key, input, signed_bytes)
            : tee::crypto::rsa_verify(*op.key, op.algorithm, salt_of(given), input, signed_bytes);
    return good ? TEE_SUCCESS : TEE_ERROR_SIGNATURE_INVALID;
  });
}

TEE_Result TEE_AsymmetricExport(TEE_OperationHandle operation, uint32_t format, void* buffer,
                                size_t* length) {
  constexpr const char* CALL = "TEE_AsymmetricExport";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::keyed_operation_of(CALL, operation, family::RSA_ENCRYPTION);
    tee::require_mode(CALL, op, TEE_MODE_EXPORT);
    output_buffer output(CALL, "buffer", buffer, length);
    if (TEE_Result fault = fault_point()) return fault;
    if (format != TEE_EXPORT_FORMAT_SPKI) return TEE_ERROR_NOT_SUPPORTED;
    return output.fill(tee::crypto::export_public_key(*op.key));
  });
}
