// The subject public key of an EC key's certificate (RFC 5480): named curve, uncompressed point.
#include "ta/alg/big_endian.h"
#include "ta/alg/ec/ec.h"
#include "ta/alg/key_record.h"
#include "ta/der/oids.h"
#include "ta/der/x509.h"

namespace keymaster {
namespace {

constexpr uint8_t UNCOMPRESSED = 0x04;

const ASN1_OID* curve_oid(uint32_t key_bits) {
  switch (key_bits) {
    case 224:
      return &OID_P_224;
    case 256:
      return &OID_P_256;
    case 384:
      return &OID_P_384;
    case 521:
      return &OID_P_521;
    default:
      return nullptr;
  }
}

// Right-aligns a number in `room`, which is zero. False when it does not fit.
bool put_coordinate(byte_view number, byte_span room) {
  number = without_leading_zeros(number);
  if (number.size() > room.size()) return false;
  copy_bytes(room.last(number.size()), number);
  return true;
}

}  // namespace

TEE_Result ec_set_key_info(byte_view key_material, X509_PUBKEY* subject_public_key,
                           keymaster_error_t* km_error) {
  const trace_scope scope;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view coordinates[2];
  if (!in.read_u32(&key_bits) || !read_numbers(&in, coordinates)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  const ASN1_OID* curve = curve_oid(key_bits);
  if (curve == nullptr) return KM_FAIL(km_error, KM_ERROR_UNKNOWN_ERROR, "Unknown curve");
  const size_t size = (size_t{key_bits} + 7) / 8;
  heap_buffer point;
  if (!point.allocate(1 + 2 * size)) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  point.span()[0] = UNCOMPRESSED;
  if (!put_coordinate(coordinates[0], point.span().subspan(1, size)) ||
      !put_coordinate(coordinates[1], point.span().subspan(1 + size, size))) {
    return KM_FAIL(km_error, KM_ERROR_UNKNOWN_ERROR, "Coordinate longer than its curve");
  }
  X509_ALGOR_set_ec(&subject_public_key->algorithm, curve);
  if (ASN1_BIT_STRING_set(&subject_public_key->key, point.size() * uint64_t{8}, point.view()) !=
      0) {
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster
