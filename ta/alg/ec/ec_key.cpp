// EC keys: description checks, key material, loading it into the platform, and public keys.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/ec/ec.h"
#include "ta/alg/key_record.h"
#include "ta/alg/key_size.h"
#include "ta/alg/provenance.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

// A curve of 192 bits can be worked on, though no key of that size can be made: intended.
constexpr ec_curve_t CURVES[] = {
    {192, TEE_ECC_CURVE_NIST_P192, TEE_ALG_ECDSA_P192, 0, nullptr},
    {224, TEE_ECC_CURVE_NIST_P224, TEE_ALG_ECDSA_P224, KM_EC_CURVE_P_224, &OID_P_224},
    {256, TEE_ECC_CURVE_NIST_P256, TEE_ALG_ECDSA_P256, KM_EC_CURVE_P_256, &OID_P_256},
    {384, TEE_ECC_CURVE_NIST_P384, TEE_ALG_ECDSA_P384, KM_EC_CURVE_P_384, &OID_P_384},
    {521, TEE_ECC_CURVE_NIST_P521, TEE_ALG_ECDSA_P521, KM_EC_CURVE_P_521, &OID_P_521},
};

// The numbers of a record, in order.
constexpr uint32_t NUMBERS[] = {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                TEE_ATTR_ECC_PRIVATE_VALUE};
constexpr size_t NUMBER_COUNT = std::size(NUMBERS);
constexpr size_t PUBLIC_NUMBER_COUNT = 2;

// The curve for a new key of this size, and the tags that the TA itself adds. They come after the
// check of the key size, unlike in the other algorithms: intended.
keymaster_error_t complete(keymaster_key_param_set_t* description, uint32_t key_bits,
                           uint32_t origin, const ec_curve_t** curve) {
  *curve = find_ec_curve(key_bits);
  if (*curve == nullptr || (*curve)->name == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_KEY_SIZE, "Invalid EC key size %d",
                  static_cast<int>(key_bits));
  }
  TRY(add_provenance(description, origin));
  return add_own_tag(description, KM_TAG_EC_CURVE, "KM_TAG_EC_CURVE", (*curve)->km_curve);
}

// Reads a record's size field and as many of its numbers as asked for.
bool read_record(input_cursor* in, uint32_t* key_bits, std::span<byte_view> numbers) {
  return in->read_u32(key_bits) && read_numbers(in, numbers);
}

}  // namespace

const ec_curve_t* find_ec_curve(uint32_t key_bits) {
  const auto* curve = std::ranges::find(CURVES, key_bits, &ec_curve_t::key_bits);
  return curve == std::end(CURVES) ? nullptr : curve;
}

outcome ec_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  const ec_curve_t* curve = nullptr;
  TRY(required_key_bits(*description, &key_bits));
  TRY(complete(description, key_bits, KM_ORIGIN_GENERATED, &curve));
  return generate_key_record({TEE_TYPE_ECDSA_KEYPAIR, key_bits, NUMBERS, curve->size() + 1},
                             value_attribute(TEE_ATTR_ECC_CURVE, curve->tee_curve), key_material);
}

outcome ec_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                      heap_buffer* key_material) {
  const trace_scope scope;
  input_cursor in(key_data);
  uint32_t key_bits = 0;
  const ec_curve_t* curve = nullptr;
  byte_view numbers[NUMBER_COUNT];
  if (!read_record(&in, &key_bits, numbers)) return fail(TEE_ERROR_GENERIC, "Too short input");
  TRY(settle_key_bits(description, key_bits, &key_bits));
  TRY(complete(description, key_bits, KM_ORIGIN_IMPORTED, &curve));
  if (!key_material->copy_of(key_data.first(key_data.size() - in.left()))) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return DONE;
}

outcome ec_export_key(byte_view key_material, byte_span output, size_t* produced) {
  const trace_scope scope;
  *produced = 0;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view point[PUBLIC_NUMBER_COUNT];
  if (!read_record(&in, &key_bits, point)) return fail(TEE_ERROR_GENERIC, "Too short input");
  output_cursor out(output);
  if (!out.write_u32(key_bits) || !out.write_field(point[0]) || !out.write_field(point[1])) {
    return fail(TEE_ERROR_GENERIC, "Too short buffer");
  }
  *produced = out.written();
  return DONE;
}

outcome ec_resolve_key_data(byte_view key_material, tee_object* key, const ec_curve_t** curve) {
  const trace_scope scope;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view numbers[NUMBER_COUNT];
  if (!read_record(&in, &key_bits, numbers)) return fail(TEE_ERROR_GENERIC, "Too short input");
  *curve = find_ec_curve(key_bits);
  if (*curve == nullptr) {
    return refuse(KM_ERROR_UNSUPPORTED_KEY_SIZE, "Unsupported key size %d",
                  static_cast<int>(key_bits));
  }
  TEE_Attribute attributes[NUMBER_COUNT + 1];
  TRY(number_attributes(NUMBERS, numbers, (*curve)->size(), attributes));
  attributes[NUMBER_COUNT] = value_attribute(TEE_ATTR_ECC_CURVE, (*curve)->tee_curve);
  return load_key(TEE_TYPE_ECDSA_KEYPAIR, key_bits, attributes, key);
}

}  // namespace keymaster
