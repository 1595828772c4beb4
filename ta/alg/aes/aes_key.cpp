// AES keys: description checks, key material, and loading it into the platform.
#include "tee_internal_api.h"

#include "ta/alg/aes/aes.h"
#include "ta/alg/key_record.h"
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
  return refuse(KM_ERROR_UNSUPPORTED_KEY_SIZE, "Invalid AES key size %d",
                static_cast<int>(key_bits));
}

bool lists_gcm(const keymaster_key_param_set_t& description) {
  for (const keymaster_key_param_t& param : description) {
    if (param.tag == KM_TAG_BLOCK_MODE && param.enumerated == KM_MODE_GCM) return true;
  }
  return false;
}

// The size, and the minimum MAC length, which belongs to keys that may be used with GCM, and to
// them alone.
keymaster_error_t check_description(const keymaster_key_param_set_t& description,
                                    uint32_t key_bits) {
  TRY(check_key_size(key_bits));
  if (!lists_gcm(description)) {
    if (!contains_tag(description, KM_TAG_MIN_MAC_LENGTH)) return KM_ERROR_OK;
    return refuse(KM_ERROR_INVALID_ARGUMENT, "Found KM_TAG_MIN_MAC_LENGTH without GCM");
  }
  const auto* min_mac = get_unique(description, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    return refuse(KM_ERROR_MISSING_MIN_MAC_LENGTH, "No or too many KM_TAG_MIN_MAC_LENGTH");
  }
  return check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, MAX_MIN_MAC_BITS);
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

outcome aes_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  TRY(add_provenance(description, KM_ORIGIN_GENERATED));
  TRY(required_key_bits(*description, &key_bits));
  TRY(check_description(*description, key_bits));
  tee_object object;
  TRY(object.allocate(TEE_TYPE_AES, key_bits));
  TRY(object.generate(key_bits, {}));
  heap_buffer record;
  byte_span key;
  if (!make_record(key_bits, &record, &key)) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  size_t length = 0;
  TRY(object.read_attribute(TEE_ATTR_SECRET_VALUE, key, &length));
  if (length != key.size()) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "Buffer size modified, before %dB, after %dB",
                  static_cast<int>(key.size()), static_cast<int>(length));
  }
  *key_material = std::move(record);
  return DONE;
}

outcome aes_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                       heap_buffer* key_material) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  TRY(add_provenance(description, KM_ORIGIN_IMPORTED));
  TRY(settle_key_bits(description, uint64_t{key_data.size()} * 8, &key_bits));
  TRY(check_description(*description, key_bits));
  heap_buffer record;
  byte_span key;
  if (!make_record(key_bits, &record, &key)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  copy_bytes(key, key_data);
  *key_material = std::move(record);
  return DONE;
}

TEE_Result aes_resolve_key_data(byte_view key_material, tee_object* key, uint32_t* key_bits) {
  const trace_scope scope;
  input_cursor in(key_material);
  byte_view bytes;
  if (!in.read_u32(key_bits) || !in.read_bytes(*key_bits / 8, &bytes)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, bytes);
  return load_key(TEE_TYPE_AES, *key_bits, {&secret, 1}, key);
}

}  // namespace keymaster
