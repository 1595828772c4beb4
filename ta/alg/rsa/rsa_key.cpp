// RSA keys: description checks, key material, loading it into the platform, and public keys.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/alg/key_record.h"
#include "ta/alg/key_size.h"
#include "ta/alg/provenance.h"
#include "ta/alg/rsa/rsa.h"

namespace keymaster {
namespace {

constexpr uint32_t MAX_KEY_BITS = 8192;
constexpr size_t EXPONENT_SIZE = sizeof(uint64_t);

// The numbers of a record, in order.
constexpr uint32_t NUMBERS[] = {
    TEE_ATTR_RSA_MODULUS,   TEE_ATTR_RSA_PUBLIC_EXPONENT, TEE_ATTR_RSA_PRIVATE_EXPONENT,
    TEE_ATTR_RSA_PRIME1,    TEE_ATTR_RSA_PRIME2,          TEE_ATTR_RSA_EXPONENT1,
    TEE_ATTR_RSA_EXPONENT2, TEE_ATTR_RSA_COEFFICIENT,
};
constexpr size_t MODULUS = 0;
constexpr size_t PUBLIC_EXPONENT = 1;
constexpr size_t PRIVATE_EXPONENT = 2;

keymaster_error_t check_key_size(uint32_t key_bits) {
  if (key_bits % 8 == 0 && key_bits <= MAX_KEY_BITS) return KM_ERROR_OK;
  return refuse(KM_ERROR_UNSUPPORTED_KEY_SIZE, "Invalid RSA key size %d",
                static_cast<int>(key_bits));
}

keymaster_error_t check_generate(keymaster_key_param_set_t* description, uint64_t* exponent,
                                 uint32_t* key_bits) {
  TRY(add_provenance(description, KM_ORIGIN_GENERATED));
  const auto* given = get_unique(*description, KM_TAG_RSA_PUBLIC_EXPONENT);
  if (given == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_RSA_PUBLIC_EXPONENT specified");
  }
  *exponent = given->long_integer;
  TRY(required_key_bits(*description, key_bits));
  return check_key_size(*key_bits);
}

// A given exponent must have the field's bytes at its end, leading zeros included.
bool ends_with(uint64_t exponent, byte_view field) {
  uint8_t bytes[EXPONENT_SIZE];
  store_u64_big_endian(bytes, exponent);
  return field.size() <= EXPONENT_SIZE &&
         std::ranges::equal(byte_view(bytes).last(field.size()), field);
}

keymaster_error_t settle_exponent(keymaster_key_param_set_t* description, byte_view field) {
  const auto* given = get_unique(*description, KM_TAG_RSA_PUBLIC_EXPONENT);
  const byte_view significant = without_leading_zeros(field);
  const bool fits = given != nullptr ? ends_with(given->long_integer, field)
                                     : significant.size() <= EXPONENT_SIZE;
  if (!fits) return refuse(KM_ERROR_IMPORT_PARAMETER_MISMATCH, "Public exponent mismatch");
  if (given == nullptr &&
      !add_long(description, KM_TAG_RSA_PUBLIC_EXPONENT, load_u64_big_endian(significant))) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return KM_ERROR_OK;
}

// Import neither adds the creation time nor refuses it: intended, the description may carry it.
keymaster_error_t check_import(keymaster_key_param_set_t* description,
                               std::span<const byte_view> numbers, uint32_t* key_bits) {
  TRY(add_provenance(description, KM_ORIGIN_IMPORTED, creation_time::NOT_ADDED));
  // The field's length as it stands: a modulus with a leading zero guesses 8 bits more, intended.
  TRY(settle_key_bits(description, uint64_t{numbers[MODULUS].size()} * 8, key_bits));
  TRY(check_key_size(*key_bits));
  return settle_exponent(description, numbers[PUBLIC_EXPONENT]);
}

// How many numbers the platform gets: what follows the private exponent comes all or not at all.
size_t number_count(std::span<const byte_view> numbers) {
  const auto derived = numbers.subspan(PRIVATE_EXPONENT + 1);
  const bool has_derived = std::ranges::any_of(derived, [](byte_view n) { return !n.empty(); });
  return has_derived ? numbers.size() : numbers.size() - derived.size();
}

// The messages of an export name the platform's calls, and every failure leaves as -1000.
TEE_Result export_public_key(const tee_object& key, byte_span output, size_t* produced) {
  TEE_OperationHandle handle{};
  TEE_Result res = TEE_AllocateOperation(&handle, TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, 0);
  tee_operation operation;
  operation.reset(handle);
  if (res != TEE_SUCCESS) return fail(res, "TEE_AllocateOperation failed: %08x", res);
  res = TEE_SetOperationKey(operation.get(), key.get());
  if (res != TEE_SUCCESS) return fail(res, "TEE_SetOperationKey failed: %08x", res);
  auto size = static_cast<tee_size>(output.size());
  res = TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI, output.data(), &size);
  if (res != TEE_SUCCESS) return fail(res, "TEE_AsymmetricExport failed: %08x", res);
  *produced = size;
  return TEE_SUCCESS;
}

}  // namespace

outcome rsa_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material) {
  const trace_scope scope;
  uint64_t exponent = 0;
  uint32_t key_bits = 0;
  TRY(check_generate(description, &exponent, &key_bits));
  uint8_t bytes[EXPONENT_SIZE];
  store_u64_big_endian(bytes, exponent);
  return generate_key_record({TEE_TYPE_RSA_KEYPAIR, key_bits, NUMBERS, key_bits / 8},
                             ref_attribute(TEE_ATTR_RSA_PUBLIC_EXPONENT, bytes), key_material);
}

outcome rsa_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                       heap_buffer* key_material) {
  const trace_scope scope;
  input_cursor in(key_data);
  byte_view numbers[std::size(NUMBERS)];
  if (!read_numbers(&in, numbers)) return fail(TEE_ERROR_GENERIC, "Too short input");
  uint32_t key_bits = 0;
  TRY(check_import(description, numbers, &key_bits));
  const byte_view consumed = key_data.first(key_data.size() - in.left());
  heap_buffer record;
  if (!record.allocate(sizeof(uint32_t) + consumed.size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  store_u32(record.span(), key_bits);
  copy_bytes(record.span().subspan(sizeof(uint32_t)), consumed);
  *key_material = std::move(record);
  return DONE;
}

outcome rsa_export_key(byte_view key_material, byte_span output, size_t* produced) {
  const trace_scope scope;
  *produced = 0;
  uint32_t key_bits = 0;
  const tee_object key = resolve_key_from_data(key_material, &key_bits);
  if (!key) return refuse(KM_ERROR_UNKNOWN_ERROR, "resolve key from data stream error");
  const TEE_Result exported = export_public_key(key, output, produced);
  return exported == TEE_SUCCESS ? KM_ERROR_OK : KM_ERROR_UNKNOWN_ERROR;
}

TEE_Result rsa_resolve_key_data(byte_view key_material, tee_object* key, uint32_t* key_bits) {
  const trace_scope scope;
  input_cursor in(key_material);
  byte_view numbers[std::size(NUMBERS)];
  if (!in.read_u32(key_bits) || !read_numbers(&in, numbers)) return TEE_ERROR_GENERIC;
  const byte_view modulus = without_leading_zeros(numbers[MODULUS]);
  if (modulus.empty() || modulus.back() % 2 == 0) {
    return fail(TEE_ERROR_BAD_PARAMETERS, "RSA modulus is not odd");
  }
  // A key is used by its modulus' real size, which zeros in front of it do not count to.
  if (modulus.size() < *key_bits / 8) *key_bits = static_cast<uint32_t>(modulus.size()) * 8;
  const size_t count = number_count(numbers);
  TEE_Attribute attributes[std::size(NUMBERS)];
  TRY(number_attributes(std::span(NUMBERS).first(count), numbers, *key_bits / 8, attributes));
  return load_key(TEE_TYPE_RSA_KEYPAIR, *key_bits, std::span(attributes).first(count), key);
}

tee_object resolve_key_from_data(byte_view key_material, uint32_t* key_bits) {
  const trace_scope scope;
  tee_object key;
  if (rsa_resolve_key_data(key_material, &key, key_bits) != TEE_SUCCESS) {
    trace(TEE_TRACE_ERROR, "Resolve key data failed");
  }
  return key;
}

}  // namespace keymaster
