// AES operations: the algorithm's tables, and the steps that encryption and decryption share.
#include "ta/alg/aes/aes_operation.h"

#include "tee_internal_api.h"

#include <algorithm>

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
  const auto* mode = std::ranges::find(MODES, block_mode, &aes_mode_t::block_mode);
  return mode == std::end(MODES) ? nullptr : mode;
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

// Only an upper bound: the key's minimum is a matter of authorisation, and the platform knows which
// lengths it offers.
keymaster_error_t read_mac_length(aes_encrypt_operation_t* operation,
                                  const keymaster_key_param_set_t& params) {
  const keymaster_key_param_t* mac_length = get_unique(params, KM_TAG_MAC_LENGTH);
  if (mac_length == nullptr) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_MAC_LENGTH");
  }
  operation->mac_bits = mac_length->integer;
  if (operation->mac_bits <= MAX_MAC_BITS && operation->mac_bits % 8 == 0) return KM_ERROR_OK;
  return refuse(KM_ERROR_UNSUPPORTED_MAC_LENGTH, "Unsupported mac length %d",
                static_cast<int>(operation->mac_bits));
}

// What the begin parameters ask for, apart from the nonce.
keymaster_error_t read_request(aes_encrypt_operation_t* operation,
                               const keymaster_key_param_set_t& params) {
  uint32_t block_mode = 0;
  if (!aes_block_mode(params, &block_mode)) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_BLOCK_MODE");
  }
  aes_padding(params, &operation->padding);
  operation->mode = mode_of(block_mode);
  if (operation->mode == nullptr) return KM_ERROR_UNSUPPORTED_BLOCK_MODE;
  if (operation->is_gcm()) TRY(read_mac_length(operation, params));
  const bool padding_fits = operation->padding == KM_PAD_NONE ||
                            (operation->padding == KM_PAD_PKCS7 && operation->mode->whole_blocks);
  return padding_fits ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_PADDING_MODE;
}

// The nonce of a new stream: the request's, or as many random bytes in `room` as the mode needs.
// Decryption draws one as well, which is intended: whether a nonce is needed is for clients to
// know.
keymaster_error_t settle_nonce(const aes_mode_t& mode, const keymaster_key_param_set_t& params,
                               byte_span room, byte_view* nonce) {
  const keymaster_key_param_t* given = get_unique(params, KM_TAG_NONCE);
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

outcome start_stream(aes_encrypt_operation_t* operation, const begin_request& request) {
  uint8_t room[MAX_NONCE_SIZE];
  byte_view nonce;
  TRY(settle_nonce(*operation->mode, request.params, room, &nonce));
  if (operation->is_gcm()) {
    TRY(operation->main.ae_init(nonce, operation->mac_bits));
  } else {
    TEE_CipherInit(operation->main.get(), nonce.empty() ? nullptr : nonce.data(),
                   static_cast<tee_size>(nonce.size()));
  }
  if (!nonce.empty() && !add_blob(request.out_params, KM_TAG_NONCE, nonce)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return DONE;
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
  if (purpose == KM_PURPOSE_ENCRYPT) return &AES_ENCRYPT_METHODS;
  return purpose == KM_PURPOSE_DECRYPT ? &AES_DECRYPT_METHODS : nullptr;
}

}  // namespace

outcome aes_prepare(aes_encrypt_operation_t* operation, uint32_t tee_mode,
                    const begin_request& request) {
  tee_operation& main = operation->main;
  const TEE_Result loaded =
      aes_resolve_key_data(request.key_material, &operation->key, &operation->key_bits);
  if (loaded != TEE_SUCCESS) return fail(loaded, "Resolve key data failed");
  TRY(read_request(operation, request.params));
  TRY(main.allocate(operation->mode->algorithm, tee_mode, operation->key_bits));
  TRY(main.set_key(operation->key.get()));
  return start_stream(operation, request);
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
  TRY(checked(TEE_CipherUpdate(operation->main.get(), input.data(),
                               static_cast<tee_size>(input.size()), room.data(), &size),
              "CipherUpdate"));
  *produced += size;
  return TEE_SUCCESS;
}

outcome aes_end_cipher(const aes_encrypt_operation_t& operation) {
  tee_size made = 0;
  TRY(checked(TEE_CipherDoFinal(operation.main.get(), nullptr, 0, nullptr, &made),
              "CipherDoFinal"));
  if (made == 0) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "CipherDoFinal make output %dB, expected %dB",
                static_cast<int>(made), 0);
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
