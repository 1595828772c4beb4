// AES operations: the algorithm's tables, and the steps that encryption and decryption share.
#include "ta/alg/aes/aes_operation.h"

#include "tee_internal_api.h"

namespace keymaster {
namespace {

constexpr uint32_t MAX_MAC_BITS = 8 * AES_MAX_TAG_SIZE;

constexpr aes_mode_t MODES[] = {
    {KM_MODE_ECB, TEE_ALG_AES_ECB_NOPAD, 0, true},
    {KM_MODE_CBC, TEE_ALG_AES_CBC_NOPAD, 16, true},
    {KM_MODE_CTR, TEE_ALG_AES_CTR, 16, false},
    {KM_MODE_GCM, TEE_ALG_AES_GCM, 12, false},
};
constexpr size_t MAX_NONCE_SIZE = 16;

const aes_mode_t* mode_of(uint32_t block_mode) {
  for (const aes_mode_t& mode : MODES) {
    if (mode.block_mode == block_mode) return &mode;
  }
  return nullptr;
}

bool aes_padding(const keymaster_key_param_set_t& params, uint32_t* value) {
  if (!requested_padding(params, value)) *value = KM_PAD_NONE;
  return true;
}

bool aes_block_mode(const keymaster_key_param_set_t& params, uint32_t* value) {
  const keymaster_key_param_t* block_mode = get_unique(params, KM_TAG_BLOCK_MODE);
  if (block_mode == nullptr) return false;
  *value = block_mode->enumerated;
  return true;
}

TEE_Result load_key(aes_encrypt_operation_t* operation, byte_view key_material) {
  const TEE_Result res = aes_resolve_key_data(key_material, &operation->key, &operation->key_bits);
  if (res != TEE_SUCCESS) trace_error("Resolve key data failed");
  return res;
}

// Only an upper bound: the key's minimum is a matter of authorisation, and the platform knows which
// lengths it offers.
keymaster_error_t read_mac_length(aes_encrypt_operation_t* operation,
                                  const keymaster_key_param_set_t& begin_params) {
  const keymaster_key_param_t* mac_length = get_unique(begin_params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    trace_error("No or too many KM_TAG_MAC_LENGTH");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  operation->mac_bits = mac_length->integer;
  if (operation->mac_bits > MAX_MAC_BITS || operation->mac_bits % 8 != 0) {
    trace_error("Unsupported mac length %d", static_cast<int>(operation->mac_bits));
    return KM_ERROR_UNSUPPORTED_MAC_LENGTH;
  }
  return KM_ERROR_OK;
}

// What the begin parameters ask for, apart from the nonce.
keymaster_error_t read_request(aes_encrypt_operation_t* operation,
                               const keymaster_key_param_set_t& begin_params) {
  uint32_t block_mode = 0;
  if (!aes_block_mode(begin_params, &block_mode)) {
    trace_error("No or too many KM_TAG_BLOCK_MODE");
    return KM_ERROR_INVALID_ARGUMENT;
  }
  aes_padding(begin_params, &operation->padding);
  operation->mode = mode_of(block_mode);
  if (operation->mode == nullptr) return KM_ERROR_UNSUPPORTED_BLOCK_MODE;
  if (operation->is_gcm()) {
    if (auto error = read_mac_length(operation, begin_params)) return error;
  }
  const bool padding_fits = operation->padding == KM_PAD_NONE ||
                            (operation->padding == KM_PAD_PKCS7 && operation->mode->whole_blocks);
  return padding_fits ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_PADDING_MODE;
}

// The nonce of a new stream: the request's, or as many random bytes in `room` as the mode needs.
// Decryption draws one as well, which is intended: whether a nonce is needed is for clients to
// know.
keymaster_error_t settle_nonce(const aes_mode_t& mode,
                               const keymaster_key_param_set_t& begin_params, byte_span room,
                               byte_view* nonce) {
  const keymaster_key_param_t* given = get_unique(begin_params, KM_TAG_NONCE);
  if (given == nullptr) {
    const byte_span drawn = room.first(mode.nonce_size);
    if (!drawn.empty()) TEE_GenerateRandom(drawn.data(), static_cast<tee_size>(drawn.size()));
    *nonce = drawn;
    return KM_ERROR_OK;
  }
  if (mode.nonce_size == 0) return KM_ERROR_INVALID_TAG;
  *nonce = given->blob();
  return nonce->size() == mode.nonce_size ? KM_ERROR_OK : KM_ERROR_INVALID_ARGUMENT;
}

TEE_Result init_platform(aes_encrypt_operation_t* operation, byte_view nonce) {
  if (operation->is_gcm()) return operation->main.ae_init(nonce, operation->mac_bits);
  const auto size = static_cast<tee_size>(nonce.size());
  TEE_CipherInit(operation->main.get(), size == 0 ? nullptr : nonce.data(), size);
  return TEE_SUCCESS;
}

TEE_Result start_stream(aes_encrypt_operation_t* operation,
                        const keymaster_key_param_set_t& begin_params,
                        keymaster_key_param_set_t* out_params, keymaster_error_t* km_error) {
  uint8_t room[MAX_NONCE_SIZE];
  byte_view nonce;
  *km_error = settle_nonce(*operation->mode, begin_params, room, &nonce);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  if (TEE_Result res = init_platform(operation, nonce)) return res;
  if (!nonce.empty() && !add_blob(out_params, KM_TAG_NONCE, nonce)) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

constexpr operation_methods_t AES_ENCRYPT_METHODS = {
    .create_operation = create_aes_encrypt,
    .get_padding = aes_padding,
    .get_block_mode = aes_block_mode,
    .get_digest = takes_none,
};

constexpr operation_methods_t AES_DECRYPT_METHODS = {
    .create_operation = create_aes_decrypt,
    .get_padding = aes_padding,
    .get_block_mode = aes_block_mode,
    .get_digest = takes_none,
};

const operation_methods_t* aes_get_operation_methods(uint32_t purpose) {
  switch (purpose) {
    case KM_PURPOSE_ENCRYPT:
      return &AES_ENCRYPT_METHODS;
    case KM_PURPOSE_DECRYPT:
      return &AES_DECRYPT_METHODS;
    default:
      return nullptr;
  }
}

}  // namespace

TEE_Result aes_prepare(aes_encrypt_operation_t* operation, uint32_t tee_mode,
                       byte_view key_material, const keymaster_key_param_set_t& begin_params,
                       keymaster_key_param_set_t* out_params, keymaster_error_t* km_error) {
  if (TEE_Result res = load_key(operation, key_material)) return res;
  *km_error = read_request(operation, begin_params);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  tee_operation& main = operation->main;
  if (TEE_Result res = main.allocate(operation->mode->algorithm, tee_mode, operation->key_bits)) {
    return res;
  }
  if (TEE_Result res = main.set_key(operation->key.get())) return res;
  return start_stream(operation, begin_params, out_params, km_error);
}

keymaster_error_t aes_take_associated_data(aes_encrypt_operation_t* operation,
                                           const keymaster_key_param_set_t& params) {
  const uint32_t count = count_tag(params, KM_TAG_ASSOCIATED_DATA);
  if (count == 0) return KM_ERROR_OK;
  if (count > 1 || !operation->is_gcm() || operation->data_started) return KM_ERROR_INVALID_TAG;
  const byte_view data = unique_blob(params, KM_TAG_ASSOCIATED_DATA);
  TEE_AEUpdateAAD(operation->main.get(), data.data(), static_cast<tee_size>(data.size()));
  return KM_ERROR_OK;
}

TEE_Result aes_feed(aes_encrypt_operation_t* operation, byte_view input, byte_span output,
                    size_t* produced) {
  if (input.empty()) return TEE_SUCCESS;
  const byte_span room = output.subspan(*produced);
  if (operation->is_gcm()) {
    size_t made = 0;
    const TEE_Result res = operation->main.ae_update(input, room, &made);
    *produced += made;
    return res;
  }
  auto size = static_cast<tee_size>(room.size());
  const TEE_Result res = TEE_CipherUpdate(operation->main.get(), input.data(),
                                          static_cast<tee_size>(input.size()), room.data(), &size);
  if (res != TEE_SUCCESS) {
    trace_error("CipherUpdate failed with 0x%08x\n", res);
    return res;
  }
  *produced += size;
  return TEE_SUCCESS;
}

TEE_Result aes_end_cipher(const aes_encrypt_operation_t& operation, keymaster_error_t* km_error) {
  tee_size made = 0;
  const TEE_Result res = TEE_CipherDoFinal(operation.main.get(), nullptr, 0, nullptr, &made);
  if (res != TEE_SUCCESS) {
    trace_error("CipherDoFinal failed with 0x%08x\n", res);
    return res;
  }
  if (made != 0) {
    trace_error("CipherDoFinal make output %dB, expected %dB", static_cast<int>(made), 0);
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

const algorithm_t AES_ALGORITHM = {
    .algorithm = KM_ALGORITHM_AES,
    .name = "AES",
    .get_operation_methods = aes_get_operation_methods,
    .generate_key = aes_generate_key,
    .import_key = aes_import_key,
    .export_key = refuse_export,
    .set_key_info = nullptr,
};

}  // namespace keymaster
