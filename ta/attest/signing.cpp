// Signing of certificates with the provisioned attestation key.
#include "tee_internal_api.h"

#include "ta/attest/attestation_key.h"
#include "ta/attest/certificate.h"
#include "ta/base/results.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

constexpr uint32_t ATTEST_KEY_BITS = 2048;
constexpr size_t FIRST_BUFFER_SIZE = 1024;

struct signature_algorithm {
  const ASN1_OID* id;
  uint32_t digest;
  uint32_t signature;
};

constexpr signature_algorithm SIGNATURE_ALGORITHMS[] = {
    {&OID_MD5_WITH_RSA_ENCRYPTION, TEE_ALG_MD5, TEE_ALG_RSASSA_PKCS1_V1_5_MD5},
    {&OID_SHA1_WITH_RSA_ENCRYPTION, TEE_ALG_SHA1, TEE_ALG_RSASSA_PKCS1_V1_5_SHA1},
    {&OID_SHA256_WITH_RSA_ENCRYPTION, TEE_ALG_SHA256, TEE_ALG_RSASSA_PKCS1_V1_5_SHA256},
    {&OID_SHA384_WITH_RSA_ENCRYPTION, TEE_ALG_SHA384, TEE_ALG_RSASSA_PKCS1_V1_5_SHA384},
    {&OID_SHA512_WITH_RSA_ENCRYPTION, TEE_ALG_SHA512, TEE_ALG_RSASSA_PKCS1_V1_5_SHA512},
};

const signature_algorithm* find_signature_algorithm(const ASN1_OID* id) {
  for (const signature_algorithm& row : SIGNATURE_ALGORITHMS) {
    if (row.id == id) return &row;
  }
  return nullptr;
}

// Results of the platform and of the writer in one number: both are negative when they fail.
int32_t as_writer_code(TEE_Result res) {
  return static_cast<int32_t>(res);
}

// Asks for the digest's size, which absorbs nothing, then digests.
int32_t digest_encoding(uint32_t algorithm, byte_view encoding, heap_buffer* digest) {
  tee_operation operation;
  if (TEE_Result res = operation.allocate(algorithm, TEE_MODE_DIGEST, 0)) {
    return as_writer_code(res);
  }
  tee_size size = 0;
  const TEE_Result asked = TEE_DigestDoFinal(
      operation.get(), encoding.data(), static_cast<tee_size>(encoding.size()), nullptr, &size);
  if (asked != TEE_ERROR_SHORT_BUFFER) {
    trace_error("DigestDoFinal failed with 0x%08x\n", asked);
    return as_writer_code(asked == TEE_SUCCESS ? TEE_ERROR_GENERIC : asked);
  }
  if (!digest->allocate(size)) return DER_NO_MEMORY;
  size_t length = 0;
  return as_writer_code(operation.digest_final(encoding, digest->span(), &length));
}

int32_t sign_digest(uint32_t algorithm, const tee_object& key, byte_view digest,
                    heap_buffer* signature) {
  TEE_ObjectInfo info{};
  if (TEE_Result res = TEE_GetObjectInfo1(key.get(), &info)) {
    trace_error("GetObjectInfo1 failed with 0x%08x\n", res);
    return as_writer_code(res);
  }
  tee_operation operation;
  if (TEE_Result res = operation.allocate(algorithm, TEE_MODE_SIGN, info.objectSize)) {
    return as_writer_code(res);
  }
  if (TEE_Result res = operation.set_key(key.get())) return as_writer_code(res);
  const auto sign = [&](uint8_t* buffer, tee_size* size) {
    return TEE_AsymmetricSignDigest(operation.get(), nullptr, 0, digest.data(),
                                    static_cast<tee_size>(digest.size()), buffer, size);
  };
  tee_size size = 0;
  TEE_Result res = sign(nullptr, &size);
  if (res == TEE_ERROR_SHORT_BUFFER) {
    if (!signature->allocate(size)) return DER_NO_MEMORY;
    res = sign(signature->data(), &size);
  }
  if (res != TEE_SUCCESS) {
    trace_error("AsymmetricSignDigest failed with 0x%08x\n", res);
    return as_writer_code(res);
  }
  signature->truncate(size);
  return 0;
}

}  // namespace

TEE_Result get_attest_key(uint32_t, tee_object* key, keymaster_error_t* km_error) {
  const trace_scope scope;
  const TEE_Attribute attributes[] = {
      ref_attribute(TEE_ATTR_RSA_MODULUS, ATTESTATION_KEY.modulus),
      ref_attribute(TEE_ATTR_RSA_PUBLIC_EXPONENT, ATTESTATION_KEY.public_exponent),
      ref_attribute(TEE_ATTR_RSA_PRIVATE_EXPONENT, ATTESTATION_KEY.private_exponent),
  };
  tee_object loaded;
  TEE_Result res = loaded.allocate(TEE_TYPE_RSA_KEYPAIR, ATTEST_KEY_BITS);
  if (res == TEE_SUCCESS) res = loaded.populate(attributes);
  if (res != TEE_SUCCESS) {
    if (*km_error == KM_ERROR_OK) *km_error = KM_ERROR_UNKNOWN_ERROR;
    return res;
  }
  *key = std::move(loaded);
  return TEE_SUCCESS;
}

int32_t X509_CINF_sign(const X509_CINF* cinf, const tee_object& key, byte_span output) {
  const trace_scope scope;
  const signature_algorithm* algorithm = find_signature_algorithm(cinf->signature.algorithm);
  if (algorithm == nullptr) return as_writer_code(TEE_ERROR_NOT_SUPPORTED);
  heap_buffer encoding;
  const int32_t encoded = asn1_encode_growing(X509_CINF_TYPE, cinf, FIRST_BUFFER_SIZE, &encoding);
  if (encoded < 0) return encoded;

  heap_buffer digest;
  heap_buffer signature;
  if (int32_t code = digest_encoding(algorithm->digest, encoding.view(), &digest)) return code;
  if (int32_t code = sign_digest(algorithm->signature, key, digest.view(), &signature)) {
    return code;
  }
  const asn1_owner<X509_CERT, X509_CERT_free> certificate(X509_CERT_alloc());
  if (!certificate) return DER_NO_MEMORY;
  certificate->cinf = cinf;
  X509_ALGOR_set_rsa(&certificate->algorithm, cinf->signature.algorithm);
  if (int32_t code = ASN1_BIT_STRING_set(&certificate->signature, signature.size() * uint64_t{8},
                                         signature.view())) {
    return code;
  }
  return X509_CERT_write(certificate.get(), output.data(), output.size());
}

}  // namespace keymaster
