// AES keys: description checks, key material, and loading it into the platform.
#include "tee_internal_api.h"

#include "ta/alg/aes/aes.h"
#include "ta/alg/key_size.h"
#include "ta/alg/mac_length.h"
#include "ta/alg/provenance.h"

namespace keymaster {
namespace {

constexpr uint32_t MIN_MIN_MAC_BITS = 96;
constexpr uint32_t MAX_MIN_MAC_BITS = 128;
constexpr size_t HEADER_SIZE = sizeof(uint32_t);

keymaster_error_t check_key_size(uint32_t key_bits) {
  if (key_bits == 128 || key_bits == 192 || key_bits == 256) return KM_ERROR_OK;
  trace_error("Invalid AES key size %d", static_cast<int>(key_bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

bool lists_gcm(const keymaster_key_param_set_t& description) {
  for (const keymaster_key_param_t& param : description) {
    if (param.tag == KM_TAG_BLOCK_MODE && param.enumerated == KM_MODE_GCM) return true;
  }
  return false;
}

// A minimum MAC length belongs to keys that may be used with GCM, and to them alone.
keymaster_error_t check_min_mac(const keymaster_key_param_set_t& description) {
  if (!lists_gcm(description)) {
    if (!contains_tag(description, KM_TAG_MIN_MAC_LENGTH)) return KM_ERROR_OK;
    trace_error("Found KM_TAG_MIN_MAC_LENGTH without GCM");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  const auto* min_mac = get_unique(description, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    trace_error("No or too many KM_TAG_MIN_MAC_LENGTH");
    return KM_ERROR_MISSING_MIN_MAC_LENGTH;
  }
  return check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, MAX_MIN_MAC_BITS);
}

keymaster_error_t check_generate(keymaster_key_param_set_t* description, uint32_t* key_bits) {
  if (auto error = add_provenance(description, KM_ORIGIN_GENERATED, creation_time::ADDED)) {
    return error;
  }
  if (auto error = required_key_bits(*description, key_bits)) return error;
  if (auto error = check_key_size(*key_bits)) return error;
  return check_min_mac(*description);
}

keymaster_error_t check_import(keymaster_key_param_set_t* description, size_t data_size,
                               uint32_t* key_bits) {
  if (auto error = add_provenance(description, KM_ORIGIN_IMPORTED, creation_time::ADDED)) {
    return error;
  }
  if (auto error = settle_key_bits(description, uint64_t{data_size} * 8, key_bits)) return error;
  if (auto error = check_key_size(*key_bits)) return error;
  return check_min_mac(*description);
}

// Makes a record with its size field; *key is the room for the key's bytes. False when out of
// memory.
bool make_record(uint32_t key_bits, heap_buffer* record, byte_span* key) {
  if (!record->allocate(HEADER_SIZE + key_bits / 8)) return false;
  store_u32(record->span(), key_bits);
  *key = record->span().subspan(HEADER_SIZE);
  return true;
}

}  // namespace

TEE_Result aes_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material,
                            keymaster_error_t* km_error) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  *km_error = check_generate(description, &key_bits);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  tee_object object;
  if (TEE_Result res = object.allocate(TEE_TYPE_AES, key_bits)) return res;
  if (TEE_Result res = object.generate(key_bits, {})) return res;
  heap_buffer record;
  byte_span key;
  if (!make_record(key_bits, &record, &key)) {
    return TEE_FAIL(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  size_t length = 0;
  if (TEE_Result res = object.read_attribute(TEE_ATTR_SECRET_VALUE, key, &length)) return res;
  if (length != key.size()) {
    return KM_FAIL(km_error, KM_ERROR_UNKNOWN_ERROR, "Buffer size modified, before %dB, after %dB",
                   static_cast<int>(key.size()), static_cast<int>(length));
  }
  *key_material = std::move(record);
  return TEE_SUCCESS;
}

TEE_Result aes_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                          heap_buffer* key_material, keymaster_error_t* km_error) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  *km_error = check_import(description, key_data.size(), &key_bits);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer record;
  byte_span key;
  if (!make_record(key_bits, &record, &key)) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  copy_bytes(key, key_data);
  *key_material = std::move(record);
  return TEE_SUCCESS;
}

TEE_Result aes_resolve_key_data(byte_view key_material, tee_object* key, uint32_t* key_bits) {
  const trace_scope scope;
  input_cursor in(key_material);
  byte_view bytes;
  if (!in.read_u32(key_bits) || !in.read_bytes(*key_bits / 8, &bytes)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, bytes);
  tee_object object;
  if (TEE_Result res = object.allocate(TEE_TYPE_AES, *key_bits)) return res;
  if (TEE_Result res = object.populate({&secret, 1})) return res;
  *key = std::move(object);
  return TEE_SUCCESS;
}

}  // namespace keymaster
