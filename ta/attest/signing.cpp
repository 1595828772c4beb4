// Signing of certificates with the provisioned attestation key.
#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/attest/attestation_key.h"
#include "ta/attest/certificate.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

constexpr uint32_t ATTEST_KEY_BITS = 2048;
constexpr size_t FIRST_BUFFER_SIZE = 1024;
// What a certificate adds to its to-be-signed part and the signature's bytes: the outer header, the
// algorithm's identifier, the header of the signature; 30 bytes or so.
constexpr size_t MAX_CERTIFICATE_OVERHEAD = 64;

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

// Asks for the digest's size, which absorbs nothing, then digests.
outcome digest_encoding(uint32_t algorithm, byte_view encoding, heap_buffer* digest) {
  tee_operation operation;
  TRY(operation.allocate(algorithm, TEE_MODE_DIGEST, 0));
  tee_size size = 0;
  const TEE_Result asked = TEE_DigestDoFinal(
      operation.get(), encoding.data(), static_cast<tee_size>(encoding.size()), nullptr, &size);
  if (asked != TEE_ERROR_SHORT_BUFFER) {
    return fail(asked == TEE_SUCCESS ? TEE_ERROR_GENERIC : asked,
                "DigestDoFinal failed with 0x%08x\n", asked);
  }
  if (!digest->allocate(size)) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  size_t length = 0;
  return operation.digest_final(encoding, digest->span(), &length);
}

outcome sign_digest(uint32_t algorithm, const tee_object& key, byte_view digest,
                    heap_buffer* signature) {
  TEE_ObjectInfo info{};
  if (TEE_Result res = TEE_GetObjectInfo1(key.get(), &info)) {
    return fail(res, "GetObjectInfo1 failed with 0x%08x\n", res);
  }
  tee_operation operation;
  TRY(operation.allocate(algorithm, TEE_MODE_SIGN, info.objectSize));
  TRY(operation.set_key(key.get()));
  const auto sign = [&](uint8_t* buffer, tee_size* size) {
    return TEE_AsymmetricSignDigest(operation.get(), nullptr, 0, digest.data(),
                                    static_cast<tee_size>(digest.size()), buffer, size);
  };
  tee_size size = 0;
  TEE_Result res = sign(nullptr, &size);
  if (res == TEE_ERROR_SHORT_BUFFER) {
    if (!signature->allocate(size)) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
    res = sign(signature->data(), &size);
  }
  if (res != TEE_SUCCESS) return fail(res, "AsymmetricSignDigest failed with 0x%08x\n", res);
  signature->truncate(size);
  return DONE;
}

// The stored number without its leading zeros: an object of the key's size has no room for them.
TEE_Attribute number_attribute(uint32_t id, byte_view number) {
  return ref_attribute(id, without_leading_zeros(number));
}

// Makes room for the certificate as far as it may be needed, at most `capacity` bytes, and encodes.
keymaster_error_t encode_certificate(const X509_CERT& signed_cinf, size_t needed, size_t capacity,
                                     heap_buffer* certificate) {
  if (!certificate->allocate(std::min(needed, capacity))) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  const int32_t length = asn1_encode(X509_CERT_TYPE, &signed_cinf, certificate->span());
  TRY(der_error(length));
  certificate->truncate(static_cast<size_t>(length));
  return KM_ERROR_OK;
}

}  // namespace

outcome get_attest_key(uint32_t, tee_object* key) {
  const trace_scope scope;
  const TEE_Attribute attributes[] = {
      number_attribute(TEE_ATTR_RSA_MODULUS, ATTESTATION_KEY.modulus),
      number_attribute(TEE_ATTR_RSA_PUBLIC_EXPONENT, ATTESTATION_KEY.public_exponent),
      number_attribute(TEE_ATTR_RSA_PRIVATE_EXPONENT, ATTESTATION_KEY.private_exponent),
  };
  tee_object loaded;
  TEE_Result res = loaded.allocate(TEE_TYPE_RSA_KEYPAIR, ATTEST_KEY_BITS);
  if (res == TEE_SUCCESS) res = loaded.populate(attributes);
  if (res != TEE_SUCCESS) return {res, KM_ERROR_UNKNOWN_ERROR};
  *key = std::move(loaded);
  return DONE;
}

outcome X509_CINF_sign(const X509_CINF* cinf, const tee_object& key, size_t capacity,
                       heap_buffer* certificate) {
  const trace_scope scope;
  const ASN1_OID* id = cinf->signature.algorithm;
  const auto* algorithm = std::ranges::find(SIGNATURE_ALGORITHMS, id, &signature_algorithm::id);
  if (algorithm == std::end(SIGNATURE_ALGORITHMS)) return TEE_ERROR_NOT_SUPPORTED;
  heap_buffer encoding;
  TRY(der_error(asn1_encode_growing(X509_CINF_TYPE, cinf, FIRST_BUFFER_SIZE, &encoding)));
  heap_buffer digest;
  heap_buffer signature;
  TRY(digest_encoding(algorithm->digest, encoding.view(), &digest));
  TRY(sign_digest(algorithm->signature, key, digest.view(), &signature));
  const asn1_owner<X509_CERT, X509_CERT_free> signed_cinf(X509_CERT_alloc());
  if (!signed_cinf) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  signed_cinf->cinf = cinf;
  X509_ALGOR_set_rsa(&signed_cinf->algorithm, id);
  TRY(der_error(ASN1_BIT_STRING_set(&signed_cinf->signature, signature.size() * uint64_t{8},
                                    signature.view())));
  const size_t needed = encoding.size() + signature.size() + MAX_CERTIFICATE_OVERHEAD;
  encoding.reset();
  return encode_certificate(*signed_cinf.get(), needed, capacity, certificate);
}

}  // namespace keymaster
