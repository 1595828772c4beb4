// Earlier Keymaster: the Keymaster of the device's earlier system, as far as a successor needs it:
// it opens the key blobs that it made.
//
// Command 27, open a blob, for the Keymaster TA alone (TEE_ERROR_ACCESS_DENIED). Slot 0, memory in
// and out: the blob; on return its plaintext, which is shorter. TEE_ERROR_ITEM_NOT_FOUND: this
// device has no blobs of the earlier system. TEE_ERROR_BAD_FORMAT: not such a blob.
// TEE_ERROR_MAC_INVALID: altered, or of another device.
// Command 100, make a blob, as the factory and tests do. Slot 0, memory input: any plaintext, at
// most 64 KiB; slot 1, memory output: the blob, 32 bytes longer. TEE_ERROR_SHORT_BUFFER: it does
// not fit; slot 1's size is then what it takes. TEE_ERROR_BAD_PARAMETERS: other slots or a longer
// plaintext. TEE_ERROR_NOT_SUPPORTED: other commands.
//
// Blob: 0 "KMv1" | 4 nonce, 12 | 16 tag, 16 | 32 ciphertext. AES-256-GCM (NIST SP 800-38D) with the
// first four bytes as additional data, under a random key that is stored at the first blob.
#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "tee/peers/support.h"

namespace {

using peers::block;

constexpr uint32_t COMMAND_OPEN_BLOB = 27;
constexpr uint32_t COMMAND_MAKE_BLOB = 100;

constexpr char KEY_NAME[] = "Blob key";
constexpr size_t KEY_SIZE = 32;
constexpr uint32_t KEY_BITS = 8 * KEY_SIZE;

constexpr uint8_t MARK[] = {'K', 'M', 'v', '1'};
constexpr size_t NONCE_OFFSET = sizeof(MARK);
constexpr size_t NONCE_SIZE = 12;
constexpr size_t TAG_OFFSET = NONCE_OFFSET + NONCE_SIZE;
constexpr size_t TAG_SIZE = 16;
constexpr size_t HEADER_SIZE = TAG_OFFSET + TAG_SIZE;
static_assert(HEADER_SIZE == 32);

constexpr size_t MAX_PLAINTEXT = 64 * 1024;
constexpr size_t MAX_BLOB = HEADER_SIZE + MAX_PLAINTEXT;

TEE_Result create_key(block* key) {
  if (TEE_Result res = key->allocate(KEY_SIZE)) return res;
  TEE_GenerateRandom(key->data(), key->size());
  TEE_ObjectHandle object = TEE_HANDLE_NULL;
  TEE_Result res = TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, KEY_NAME, sizeof(KEY_NAME),
                                              TEE_DATA_FLAG_ACCESS_READ, TEE_HANDLE_NULL,
                                              key->data(), key->size(), &object);
  if (res == TEE_SUCCESS) TEE_CloseObject(object);
  return res;
}

TEE_Result read_key(block* key) {
  TEE_ObjectHandle object = TEE_HANDLE_NULL;
  TEE_Result res = TEE_OpenPersistentObject(TEE_STORAGE_PRIVATE, KEY_NAME, sizeof(KEY_NAME),
                                            TEE_DATA_FLAG_ACCESS_READ, &object);
  if (res != TEE_SUCCESS) return res;
  res = key->read_object(object);
  TEE_CloseObject(object);
  if (res == TEE_SUCCESS && key->size() != KEY_SIZE) res = TEE_ERROR_BAD_STATE;
  return res;
}

TEE_Result set_key(TEE_OperationHandle gcm, block* key) {
  TEE_ObjectHandle object = TEE_HANDLE_NULL;
  TEE_Result res = TEE_AllocateTransientObject(TEE_TYPE_AES, KEY_BITS, &object);
  if (res != TEE_SUCCESS) return res;
  TEE_Attribute secret;
  TEE_InitRefAttribute(&secret, TEE_ATTR_SECRET_VALUE, key->data(), key->size());
  res = TEE_PopulateTransientObject(object, &secret, 1);
  if (res == TEE_SUCCESS) res = TEE_SetOperationKey(gcm, object);
  TEE_FreeTransientObject(object);
  return res;
}

// Starts GCM in `mode` with the nonce of `blob`; *gcm is for the caller to free, also on failure.
TEE_Result start(uint32_t mode, block* key, const uint8_t* blob, TEE_OperationHandle* gcm) {
  TEE_Result res = TEE_AllocateOperation(gcm, TEE_ALG_AES_GCM, mode, KEY_BITS);
  if (res == TEE_SUCCESS) res = set_key(*gcm, key);
  if (res == TEE_SUCCESS) {
    res = TEE_AEInit(*gcm, blob + NONCE_OFFSET, NONCE_SIZE, 8 * TAG_SIZE, 0, 0);
  }
  if (res == TEE_SUCCESS) TEE_AEUpdateAAD(*gcm, MARK, sizeof(MARK));
  return res;
}

TEE_Result seal(block* key, block* plaintext, block* blob) {
  if (TEE_Result res = blob->allocate(HEADER_SIZE + plaintext->size())) return res;
  memcpy(blob->data(), MARK, sizeof(MARK));
  TEE_GenerateRandom(blob->data() + NONCE_OFFSET, NONCE_SIZE);
  TEE_OperationHandle gcm = TEE_HANDLE_NULL;
  TEE_Result res = start(TEE_MODE_ENCRYPT, key, blob->data(), &gcm);
  if (res == TEE_SUCCESS) {
    size_t written = plaintext->size();
    size_t tag_size = TAG_SIZE;
    res = TEE_AEEncryptFinal(gcm, plaintext->data(), plaintext->size(), blob->data() + HEADER_SIZE,
                             &written, blob->data() + TAG_OFFSET, &tag_size);
  }
  TEE_FreeOperation(gcm);
  return res;
}

TEE_Result unseal(block* key, block* blob, block* plaintext) {
  if (TEE_Result res = plaintext->allocate(blob->size() - HEADER_SIZE)) return res;
  TEE_OperationHandle gcm = TEE_HANDLE_NULL;
  TEE_Result res = start(TEE_MODE_DECRYPT, key, blob->data(), &gcm);
  if (res == TEE_SUCCESS) {
    size_t written = plaintext->size();
    res = TEE_AEDecryptFinal(gcm, blob->data() + HEADER_SIZE, blob->size() - HEADER_SIZE,
                             plaintext->data(), &written, blob->data() + TAG_OFFSET, TAG_SIZE);
  }
  TEE_FreeOperation(gcm);
  return res;
}

TEE_Result make_blob(uint32_t types, TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0) ||
      params[0].memref.size > MAX_PLAINTEXT) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  const size_t capacity = params[1].memref.size;
  params[1].memref.size = HEADER_SIZE + params[0].memref.size;
  if (capacity < params[1].memref.size) return TEE_ERROR_SHORT_BUFFER;
  block plaintext;
  if (TEE_Result res = plaintext.copy_of(params[0].memref.buffer, params[0].memref.size)) {
    return res;
  }
  block key;
  TEE_Result res = read_key(&key);
  if (res == TEE_ERROR_ITEM_NOT_FOUND) res = create_key(&key);
  if (res != TEE_SUCCESS) return res;
  block blob;
  res = seal(&key, &plaintext, &blob);
  if (res == TEE_SUCCESS) memcpy(params[1].memref.buffer, blob.data(), blob.size());
  return res;
}

TEE_Result open_blob(uint32_t types, TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INOUT, 0, 0, 0)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (TEE_Result res = peers::require_keymaster()) return res;
  block key;
  if (TEE_Result res = read_key(&key)) return res;
  const size_t size = params[0].memref.size;
  if (size < HEADER_SIZE || size > MAX_BLOB) return TEE_ERROR_BAD_FORMAT;
  block blob;
  if (TEE_Result res = blob.copy_of(params[0].memref.buffer, size)) return res;
  if (memcmp(blob.data(), MARK, sizeof(MARK)) != 0) return TEE_ERROR_BAD_FORMAT;
  block plaintext;
  if (TEE_Result res = unseal(&key, &blob, &plaintext)) return res;
  memcpy(params[0].memref.buffer, plaintext.data(), plaintext.size());
  params[0].memref.size = plaintext.size();
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result TA_InvokeCommandEntryPoint(void* /*sessionContext*/, uint32_t commandID,
                                      uint32_t paramTypes, TEE_Param* params) {
  switch (commandID) {
    case COMMAND_OPEN_BLOB:
      return open_blob(paramTypes, params);
    case COMMAND_MAKE_BLOB:
      return make_blob(paramTypes, params);
    default:
      return TEE_ERROR_NOT_SUPPORTED;
  }
}
