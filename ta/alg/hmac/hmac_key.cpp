// HMAC keys: description checks, key material, and loading it into the platform.
#include "tee_internal_api.h"

#include "ta/alg/hmac/hmac.h"
#include "ta/alg/key_record.h"
#include "ta/alg/key_size.h"
#include "ta/alg/mac_length.h"
#include "ta/alg/message.h"
#include "ta/alg/provenance.h"

namespace keymaster {
namespace {

constexpr uint32_t MAX_KEY_BITS = 1024;
constexpr uint32_t MIN_MIN_MAC_BITS = 64;
constexpr size_t HEADER_SIZE = 2 * sizeof(uint32_t);
constexpr size_t MAX_BLOCK_SIZE = 128;  // of the hashes below

constexpr hmac_hash_t HASHES[] = {
    {KM_DIGEST_SHA1, TEE_TYPE_HMAC_SHA1, TEE_ALG_HMAC_SHA1, 160, 512},
    {KM_DIGEST_SHA_2_224, TEE_TYPE_HMAC_SHA224, TEE_ALG_HMAC_SHA224, 224, 512},
    {KM_DIGEST_SHA_2_256, TEE_TYPE_HMAC_SHA256, TEE_ALG_HMAC_SHA256, 256, 512},
    {KM_DIGEST_SHA_2_384, TEE_TYPE_HMAC_SHA384, TEE_ALG_HMAC_SHA384, 384, 1024},
    {KM_DIGEST_SHA_2_512, TEE_TYPE_HMAC_SHA512, TEE_ALG_HMAC_SHA512, 512, 1024},
};

keymaster_error_t check_key_size(uint32_t key_bits) {
  if (key_bits != 0 && key_bits <= MAX_KEY_BITS && key_bits % 8 == 0) return KM_ERROR_OK;
  trace_error("Invalid hmac key size %d", static_cast<int>(key_bits));
  return KM_ERROR_UNSUPPORTED_KEY_SIZE;
}

// The minimum MAC length and the digest of a description; *hash receives the digest's row.
keymaster_error_t check_mac_and_digest(const keymaster_key_param_set_t& description,
                                       const hmac_hash_t** hash) {
  const auto* min_mac = get_unique(description, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    trace_error("No or too many KM_TAG_MIN_MAC_LENGTH or specified");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  if (auto error = check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, UINT32_MAX)) {
    return error;
  }
  const auto* digest = get_unique(description, KM_TAG_DIGEST);
  if (digest == nullptr) {
    trace_error("No or too many KM_TAG_DIGEST");
    return KM_ERROR_UNSUPPORTED_DIGEST;
  }
  *hash = hmac_hash_of_digest(digest->enumerated);
  if (*hash == nullptr) return KM_ERROR_UNSUPPORTED_DIGEST;
  return check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, (*hash)->mac_bits);
}

// Writes the record's two header fields and gives the room for the key's bytes behind them. The
// buffer was made to fit.
byte_span write_header(heap_buffer* record, uint32_t key_bits, uint32_t object_type) {
  store_u32(record->span(), key_bits);
  store_u32(record->span().subspan(sizeof(uint32_t)), object_type);
  return record->span().subspan(HEADER_SIZE);
}

keymaster_error_t check_generate(keymaster_key_param_set_t* description, uint32_t* key_bits,
                                 const hmac_hash_t** hash) {
  if (auto error = add_provenance(description, KM_ORIGIN_GENERATED, creation_time::ADDED)) {
    return error;
  }
  if (auto error = required_key_bits(*description, key_bits)) return error;
  if (auto error = check_key_size(*key_bits)) return error;
  return check_mac_and_digest(*description, hash);
}

keymaster_error_t check_import(keymaster_key_param_set_t* description, size_t data_size,
                               uint32_t* key_bits, const hmac_hash_t** hash) {
  if (auto error = add_provenance(description, KM_ORIGIN_IMPORTED, creation_time::ADDED)) {
    return error;
  }
  if (auto error = settle_key_bits(description, uint64_t{data_size} * 8, key_bits)) return error;
  if (auto error = check_key_size(*key_bits)) return error;
  return check_mac_and_digest(*description, hash);
}

// HMAC's key preparation: a key longer than the block is replaced by its digest; the rest of the
// block is zeros.
TEE_Result normalise(byte_view key, const hmac_hash_t& hash, byte_span block) {
  if (key.size() <= block.size()) {
    copy_bytes(block, key);
    return TEE_SUCCESS;
  }
  const trace_scope scope("hash");
  tee_operation digest;
  size_t length = 0;
  const uint32_t algorithm = find_digest(hash.digest)->algorithm;
  if (TEE_Result res = digest.allocate(algorithm, TEE_MODE_DIGEST, 0)) return res;
  return digest.digest_final(key, block, &length);
}

// Loads the key of one block that `bytes` stand for.
TEE_Result load_normalised(byte_view bytes, const hmac_hash_t& hash, tee_object* object) {
  uint8_t room[MAX_BLOCK_SIZE] = {};
  const byte_span block = byte_span(room).first(hash.block_bits / 8);
  TEE_Result res = normalise(bytes, hash, block);
  if (res == TEE_SUCCESS) {
    const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, block);
    res = load_key(hash.object_type, hash.block_bits, {&secret, 1}, object);
  }
  wipe(room);
  return res;
}

// Reads a record into *key_bits, *object_type and a view of the key's bytes.
bool read_record(byte_view key_material, uint32_t* key_bits, uint32_t* object_type,
                 byte_view* key) {
  input_cursor in(key_material);
  return in.read_u32(key_bits) && in.read_u32(object_type) && in.read_bytes(*key_bits / 8, key);
}

}  // namespace

const hmac_hash_t* hmac_hash_of_digest(uint32_t digest) {
  for (const hmac_hash_t& hash : HASHES) {
    if (hash.digest == digest) return &hash;
  }
  return nullptr;
}

const hmac_hash_t* hmac_hash_of_type(uint32_t object_type) {
  for (const hmac_hash_t& hash : HASHES) {
    if (hash.object_type == object_type) return &hash;
  }
  return nullptr;
}

TEE_Result hmac_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material,
                             keymaster_error_t* km_error) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  const hmac_hash_t* hash = nullptr;
  *km_error = check_generate(description, &key_bits, &hash);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer record;
  if (!record.allocate(HEADER_SIZE + key_bits / 8)) {
    return TEE_FAIL(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  const byte_span key = write_header(&record, key_bits, hash->object_type);
  TEE_GenerateRandom(key.data(), static_cast<tee_size>(key.size()));
  *key_material = std::move(record);
  return TEE_SUCCESS;
}

TEE_Result hmac_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                           heap_buffer* key_material, keymaster_error_t* km_error) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  const hmac_hash_t* hash = nullptr;
  *km_error = check_import(description, key_data.size(), &key_bits, &hash);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer record;
  if (!record.allocate(HEADER_SIZE + key_data.size())) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  copy_bytes(write_header(&record, key_bits, hash->object_type), key_data);
  *key_material = std::move(record);
  return TEE_SUCCESS;
}

TEE_Result hmac_resolve_key_data(byte_view key_material, hmac_key_t* key,
                                 keymaster_error_t* km_error) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  uint32_t object_type = 0;
  byte_view bytes;
  if (!read_record(key_material, &key_bits, &object_type, &bytes)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  const hmac_hash_t* hash = hmac_hash_of_type(object_type);
  if (hash == nullptr) {
    // Intended: no key of another type is ever made.
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  if (TEE_Result res = load_normalised(bytes, *hash, &key->object)) return res;
  key->key_bits = hash->block_bits;
  key->object_type = object_type;
  return TEE_SUCCESS;
}

}  // namespace keymaster
