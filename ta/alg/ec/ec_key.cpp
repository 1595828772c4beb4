// EC keys: description checks, key material, loading it into the platform, and public keys.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/ec/ec.h"
#include "ta/alg/key_record.h"
#include "ta/alg/key_size.h"
#include "ta/alg/provenance.h"

namespace keymaster {
namespace {

// A curve of 192 bits can be worked on, though no key of that size can be made: intended.
constexpr ec_curve_t CURVES[] = {
    {192, TEE_ECC_CURVE_NIST_P192, TEE_ALG_ECDSA_P192, NO_EC_CURVE},
    {224, TEE_ECC_CURVE_NIST_P224, TEE_ALG_ECDSA_P224, KM_EC_CURVE_P_224},
    {256, TEE_ECC_CURVE_NIST_P256, TEE_ALG_ECDSA_P256, KM_EC_CURVE_P_256},
    {384, TEE_ECC_CURVE_NIST_P384, TEE_ALG_ECDSA_P384, KM_EC_CURVE_P_384},
    {521, TEE_ECC_CURVE_NIST_P521, TEE_ALG_ECDSA_P521, KM_EC_CURVE_P_521},
};

// The numbers of a record, in order.
constexpr uint32_t NUMBERS[] = {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                TEE_ATTR_ECC_PRIVATE_VALUE};
constexpr size_t NUMBER_COUNT = std::size(NUMBERS);
constexpr size_t PUBLIC_NUMBER_COUNT = 2;

// The curve for a new key of this size.
keymaster_error_t choose_curve(uint32_t key_bits, const ec_curve_t** curve) {
  *curve = find_ec_curve(key_bits);
  if (*curve != nullptr && (*curve)->km_curve != NO_EC_CURVE) return KM_ERROR_OK;
  trace_error("Invalid EC key size %d", static_cast<int>(key_bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

// The tags that the TA itself adds. They come after the check of the key size, unlike in the other
// algorithms: intended.
keymaster_error_t add_own_tags(keymaster_key_param_set_t* description, uint32_t origin,
                               const ec_curve_t& curve) {
  if (auto error = add_provenance(description, origin, creation_time::ADDED)) return error;
  if (contains_tag(*description, KM_TAG_EC_CURVE)) {
    trace_error("Shouldn't specify KM_TAG_EC_CURVE");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (!add_integer(description, KM_TAG_EC_CURVE, curve.km_curve)) {
    trace_error("Out of memory");
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return KM_ERROR_OK;
}

keymaster_error_t check_generate(keymaster_key_param_set_t* description, const ec_curve_t** curve) {
  uint32_t key_bits = 0;
  if (auto error = required_key_bits(*description, &key_bits)) return error;
  if (auto error = choose_curve(key_bits, curve)) return error;
  return add_own_tags(description, KM_ORIGIN_GENERATED, **curve);
}

keymaster_error_t check_import(keymaster_key_param_set_t* description, uint32_t guessed_bits) {
  uint32_t key_bits = 0;
  const ec_curve_t* curve = nullptr;
  if (auto error = settle_key_bits(description, guessed_bits, &key_bits)) return error;
  if (auto error = choose_curve(key_bits, &curve)) return error;
  return add_own_tags(description, KM_ORIGIN_IMPORTED, *curve);
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

TEE_Result ec_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material,
                           keymaster_error_t* km_error) {
  const trace_scope scope;
  const ec_curve_t* curve = nullptr;
  *km_error = check_generate(description, &curve);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  return generate_key_record(TEE_TYPE_ECDSA_KEYPAIR, curve->key_bits,
                             value_attribute(TEE_ATTR_ECC_CURVE, curve->tee_curve), NUMBERS,
                             curve->size() + 1, key_material, km_error);
}

TEE_Result ec_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                         heap_buffer* key_material, keymaster_error_t* km_error) {
  const trace_scope scope;
  input_cursor in(key_data);
  uint32_t key_bits = 0;
  byte_view numbers[NUMBER_COUNT];
  if (!read_record(&in, &key_bits, numbers)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  *km_error = check_import(description, key_bits);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer record;
  if (!record.copy_of(key_data.first(key_data.size() - in.left()))) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  *key_material = std::move(record);
  return TEE_SUCCESS;
}

TEE_Result ec_export_key(byte_view key_material, byte_span output, size_t* produced,
                         keymaster_error_t*) {
  const trace_scope scope;
  *produced = 0;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view point[PUBLIC_NUMBER_COUNT];
  if (!read_record(&in, &key_bits, point)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  output_cursor out(output);
  if (!out.write_u32(key_bits) || !out.write_field(point[0]) || !out.write_field(point[1])) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short buffer");
  }
  *produced = out.written();
  return TEE_SUCCESS;
}

TEE_Result ec_resolve_key_data(byte_view key_material, tee_object* key, uint32_t* key_bits,
                               keymaster_error_t* km_error) {
  const trace_scope scope;
  TEE_Attribute attributes[NUMBER_COUNT + 1];
  if (!read_attributes(key_material, NUMBERS, key_bits, attributes)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  const ec_curve_t* curve = find_ec_curve(*key_bits);
  if (curve == nullptr) {
    return KM_FAIL(km_error, KM_ERROR_UNSUPPORTED_KEY_SIZE, "Unsupported key size %d",
                   static_cast<int>(*key_bits));
  }
  attributes[NUMBER_COUNT] = value_attribute(TEE_ATTR_ECC_CURVE, curve->tee_curve);
  return load_key(TEE_TYPE_ECDSA_KEYPAIR, *key_bits, attributes, key);
}

}  // namespace keymaster
