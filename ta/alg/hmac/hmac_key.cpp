// HMAC keys: description checks, key material, and loading it into the platform.
#include "tee_internal_api.h"

#include <algorithm>

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
  return refuse(KM_ERROR_UNSUPPORTED_KEY_SIZE, "Invalid hmac key size %d",
                static_cast<int>(key_bits));
}

// The row in which `member` has this value, or null.
const hmac_hash_t* find_hash(uint32_t hmac_hash_t::*member, uint32_t value) {
  const auto* hash = std::ranges::find(HASHES, value, member);
  return hash == std::end(HASHES) ? nullptr : hash;
}

// The key size, the minimum MAC length and the digest of a description; *object_type receives the
// platform's for the digest.
keymaster_error_t check_description(const keymaster_key_param_set_t& description, uint32_t key_bits,
                                    uint32_t* object_type) {
  TRY(check_key_size(key_bits));
  const auto* min_mac = get_unique(description, KM_TAG_MIN_MAC_LENGTH);
  if (min_mac == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_MIN_MAC_LENGTH or specified");
  }
  TRY(check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, UINT32_MAX));
  uint32_t digest = 0;
  if (!requested_digest(description, &digest)) {
    return refuse(KM_ERROR_UNSUPPORTED_DIGEST, "No or too many KM_TAG_DIGEST");
  }
  const hmac_hash_t* hash = find_hash(&hmac_hash_t::digest, digest);
  if (hash == nullptr) return KM_ERROR_UNSUPPORTED_DIGEST;
  *object_type = hash->object_type;
  return check_min_mac_bits(min_mac->integer, MIN_MIN_MAC_BITS, hash->mac_bits);
}

// Writes the record's two header fields and gives the room for the key's bytes behind them. The
// buffer was made to fit.
byte_span write_header(heap_buffer* record, uint32_t key_bits, uint32_t object_type) {
  store_u32(record->span(), key_bits);
  store_u32(record->span().subspan(sizeof(uint32_t)), object_type);
  return record->span().subspan(HEADER_SIZE);
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
  TRY(digest.allocate(algorithm, TEE_MODE_DIGEST, 0));
  return digest.digest_final(key, block, &length);
}

// Loads the key of one block that `bytes` stand for.
TEE_Result load_normalised(byte_view bytes, const hmac_hash_t& hash, tee_object* object) {
  secret_bytes<MAX_BLOCK_SIZE> room;
  const byte_span block = byte_span(room).first(hash.block_bits / 8);
  TRY(normalise(bytes, hash, block));
  const TEE_Attribute secret = ref_attribute(TEE_ATTR_SECRET_VALUE, block);
  return load_key(hash.object_type, hash.block_bits, {&secret, 1}, object);
}

}  // namespace

outcome hmac_generate_key(keymaster_key_param_set_t* description, heap_buffer* key_material) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  uint32_t object_type = 0;
  TRY(add_provenance(description, KM_ORIGIN_GENERATED));
  TRY(required_key_bits(*description, &key_bits));
  TRY(check_description(*description, key_bits, &object_type));
  heap_buffer record;
  if (!record.allocate(HEADER_SIZE + key_bits / 8)) {
    return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  }
  const byte_span key = write_header(&record, key_bits, object_type);
  TEE_GenerateRandom(key.data(), static_cast<tee_size>(key.size()));
  *key_material = std::move(record);
  return DONE;
}

outcome hmac_import_key(keymaster_key_param_set_t* description, byte_view key_data,
                        heap_buffer* key_material) {
  const trace_scope scope;
  uint32_t key_bits = 0;
  uint32_t object_type = 0;
  TRY(add_provenance(description, KM_ORIGIN_IMPORTED));
  TRY(settle_key_bits(description, uint64_t{key_data.size()} * 8, &key_bits));
  TRY(check_description(*description, key_bits, &object_type));
  heap_buffer record;
  if (!record.allocate(HEADER_SIZE + key_data.size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  copy_bytes(write_header(&record, key_bits, object_type), key_data);
  *key_material = std::move(record);
  return DONE;
}

outcome hmac_resolve_key_data(byte_view key_material, tee_object* key, const hmac_hash_t** hash) {
  const trace_scope scope;
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  uint32_t object_type = 0;
  byte_view bytes;
  if (!in.read_u32(&key_bits) || !in.read_u32(&object_type) ||
      !in.read_bytes(key_bits / 8, &bytes)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  *hash = find_hash(&hmac_hash_t::object_type, object_type);
  // Intended: no key of another type is ever made.
  if (*hash == nullptr) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  return load_normalised(bytes, **hash, key);
}

}  // namespace keymaster
