// Authenticator: a trusted application that vouches for users. It stands where a device has its
// password or fingerprint application, and issues authentication tokens to whoever asks.
//
// Command 1, issue a token. Slot 0, memory input, exactly 28 bytes, little-endian: challenge (u64),
// user id (u64), authenticator id (u64), authenticator type (u32). Slot 1, memory output, at least
// 69 bytes: the token. TEE_ERROR_BAD_PARAMETERS for other slots or another length of the request,
// TEE_ERROR_SHORT_BUFFER (and 69 as the size of slot 1) when the token does not fit,
// TEE_ERROR_NOT_SUPPORTED for other commands.
//
// Token, 69 bytes: version 0 (1); challenge, user id, authenticator id (8 each, little-endian);
// type (4, big-endian); REE time in milliseconds (8, big-endian); HMAC-SHA256 of all before (32),
// keyed with the boot seed.
#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "tee/peers/support.h"

namespace {

using peers::wipe;

constexpr uint32_t COMMAND_ISSUE_TOKEN = 1;

constexpr size_t ID_LENGTH = 8;
constexpr size_t TYPE_LENGTH = 4;
constexpr size_t REQUEST_LENGTH = 3 * ID_LENGTH + TYPE_LENGTH;

constexpr size_t IDS_OFFSET = 1;
constexpr size_t TYPE_OFFSET = IDS_OFFSET + 3 * ID_LENGTH;
constexpr size_t TIME_OFFSET = TYPE_OFFSET + TYPE_LENGTH;
constexpr size_t MAC_OFFSET = TIME_OFFSET + 8;
constexpr size_t MAC_LENGTH = 32;
constexpr size_t TOKEN_LENGTH = MAC_OFFSET + MAC_LENGTH;
static_assert(REQUEST_LENGTH == 28 && TOKEN_LENGTH == 69);

constexpr size_t SEED_LENGTH = 32;
constexpr uint32_t KEY_BITS = 8 * SEED_LENGTH;

TEE_ObjectHandle token_key = TEE_HANDLE_NULL;

void put_big_endian(uint8_t* out, uint64_t value, size_t length) {
  for (size_t i = length; i-- > 0; value >>= 8)
    out[i] = static_cast<uint8_t>(value);
}

void free_token_key() {
  TEE_FreeTransientObject(token_key);
  token_key = TEE_HANDLE_NULL;
}

TEE_Result load_token_key() {
  uint8_t seed[SEED_LENGTH];
  if (TEE_Result res = GetBootSeed(seed, sizeof(seed))) return res;
  TEE_Attribute secret;
  TEE_InitRefAttribute(&secret, TEE_ATTR_SECRET_VALUE, seed, sizeof(seed));
  TEE_Result res = TEE_AllocateTransientObject(TEE_TYPE_HMAC_SHA256, KEY_BITS, &token_key);
  if (res == TEE_SUCCESS) res = TEE_PopulateTransientObject(token_key, &secret, 1);
  wipe(seed, sizeof(seed));
  if (res != TEE_SUCCESS) free_token_key();
  return res;
}

TEE_Result compute_mac(const uint8_t* data, size_t length, uint8_t* mac) {
  TEE_OperationHandle operation = TEE_HANDLE_NULL;
  TEE_Result res = TEE_AllocateOperation(&operation, TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, KEY_BITS);
  if (res != TEE_SUCCESS) return res;
  res = TEE_SetOperationKey(operation, token_key);
  if (res == TEE_SUCCESS) {
    size_t mac_length = MAC_LENGTH;
    TEE_MACInit(operation, nullptr, 0);
    res = TEE_MACComputeFinal(operation, data, length, mac, &mac_length);
  }
  TEE_FreeOperation(operation);
  return res;
}

TEE_Result issue_token(const uint8_t* request, uint8_t* token) {
  token[0] = 0;
  memcpy(token + IDS_OFFSET, request, 3 * ID_LENGTH);
  for (size_t i = 0; i < TYPE_LENGTH; i++) {
    token[TYPE_OFFSET + i] = request[REQUEST_LENGTH - 1 - i];
  }
  TEE_Time now;
  TEE_GetREETime(&now);
  put_big_endian(token + TIME_OFFSET, uint64_t{now.seconds} * 1000 + now.millis, 8);
  return compute_mac(token, MAC_OFFSET, token + MAC_OFFSET);
}

TEE_Result handle_issue_token(uint32_t types, TEE_Param* params) {
  if (types != TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                               TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (params[0].memref.size != REQUEST_LENGTH) return TEE_ERROR_BAD_PARAMETERS;
  size_t capacity = params[1].memref.size;
  params[1].memref.size = TOKEN_LENGTH;
  if (capacity < TOKEN_LENGTH) return TEE_ERROR_SHORT_BUFFER;

  // Request and token may be the client's memory, so the token is made in this memory and then goes
  // out whole.
  uint8_t request[REQUEST_LENGTH];
  uint8_t token[TOKEN_LENGTH];
  memcpy(request, params[0].memref.buffer, sizeof(request));
  TEE_Result res = issue_token(request, token);
  if (res == TEE_SUCCESS) {
    memcpy(params[1].memref.buffer, token, sizeof(token));
  } else {
    params[1].memref.size = 0;
  }
  return res;
}

}  // namespace

TEE_Result TA_CreateEntryPoint() {
  return load_token_key();
}

void TA_DestroyEntryPoint() {
  free_token_key();
}

TEE_Result TA_OpenSessionEntryPoint(uint32_t paramTypes, TEE_Param* /*params*/,
                                    void** /*sessionContext*/) {
  return paramTypes == 0 ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}

void TA_CloseSessionEntryPoint(void* /*sessionContext*/) {}

TEE_Result TA_InvokeCommandEntryPoint(void* /*sessionContext*/, uint32_t commandID,
                                      uint32_t paramTypes, TEE_Param* params) {
  if (commandID != COMMAND_ISSUE_TOKEN) return TEE_ERROR_NOT_SUPPORTED;
  return handle_issue_token(paramTypes, params);
}
