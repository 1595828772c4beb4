// The subject public key of an EC key's certificate (RFC 5480): named curve, uncompressed point.
#include "ta/alg/big_endian.h"
#include "ta/alg/ec/ec.h"
#include "ta/alg/key_record.h"
#include "ta/der/x509.h"

namespace keymaster {
namespace {

constexpr uint8_t UNCOMPRESSED = 0x04;

// Right-aligns a number in `room`, which is zero. False when it does not fit.
bool put_coordinate(byte_view number, byte_span room) {
  number = without_leading_zeros(number);
  if (number.size() > room.size()) return false;
  copy_bytes(room.last(number.size()), number);
  return true;
}

}  // namespace

outcome ec_set_key_info(byte_view key_material, X509_PUBKEY* subject_public_key) {
  const trace_scope scope;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view coordinates[2];
  if (!in.read_u32(&key_bits) || !read_numbers(&in, coordinates)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  const ec_curve_t* curve = find_ec_curve(key_bits);
  if (curve == nullptr || curve->name == nullptr) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "Unknown curve");
  }
  const size_t size = curve->size();
  heap_buffer point;
  if (!point.allocate(1 + 2 * size)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  point.span()[0] = UNCOMPRESSED;
  if (!put_coordinate(coordinates[0], point.span().subspan(1, size)) ||
      !put_coordinate(coordinates[1], point.span().subspan(1 + size, size))) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "Coordinate longer than its curve");
  }
  X509_ALGOR_set_ec(&subject_public_key->algorithm, curve->name);
  const int32_t set =
      ASN1_BIT_STRING_set(&subject_public_key->key, point.size() * uint64_t{8}, point.view());
  return set == 0 ? KM_ERROR_OK : KM_ERROR_MEMORY_ALLOCATION_FAILED;
}

}  // namespace keymaster
