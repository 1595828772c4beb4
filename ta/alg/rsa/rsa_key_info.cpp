// The subject public key of an RSA key's certificate (RFC 3279, RFC 8017).
#include "ta/alg/key_record.h"
#include "ta/alg/rsa/rsa.h"
#include "ta/der/oids.h"
#include "ta/der/x509.h"

namespace keymaster {
namespace {

constexpr size_t FIRST_BUFFER_SIZE = 512;

keymaster_error_t encode_key(byte_view modulus, byte_view exponent, heap_buffer* encoding) {
  const asn1_owner<RSA_PUBKEY, RSA_PUBKEY_free> key(RSA_PUBKEY_alloc());
  if (!key || ASN1_OCTET_STRING_set(&key->n, modulus) != 0 ||
      ASN1_OCTET_STRING_set(&key->e, exponent) != 0) {
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  const int32_t length =
      asn1_encode_growing(RSA_PUBKEY_TYPE, key.get(), FIRST_BUFFER_SIZE, encoding);
  return length < 0 ? KM_ERROR_MEMORY_ALLOCATION_FAILED : KM_ERROR_OK;
}

}  // namespace

outcome rsa_set_key_info(byte_view key_material, X509_PUBKEY* subject_public_key) {
  const trace_scope scope;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view numbers[2];
  if (!in.read_u32(&key_bits) || !read_numbers(&in, numbers)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  heap_buffer encoding;
  TRY(encode_key(numbers[0], numbers[1], &encoding));
  X509_ALGOR_set_rsa(&subject_public_key->algorithm, &OID_RSA_ENCRYPTION);
  const int32_t set =
      ASN1_BIT_STRING_set(&subject_public_key->key, encoding.size() * uint64_t{8}, encoding.view());
  return set == 0 ? KM_ERROR_OK : KM_ERROR_MEMORY_ALLOCATION_FAILED;
}

}  // namespace keymaster
