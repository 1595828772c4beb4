// RSA operations: the algorithm's tables, and the steps that the purposes share.
#include "ta/alg/rsa/rsa_operation.h"

#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <algorithm>
#include <bit>

#include "ta/alg/big_endian.h"

namespace keymaster {
namespace {

// A PSS signature needs room for the digest, its two flag bytes and a salt of at least 20 bytes.
constexpr size_t PSS_OVERHEAD = 22;

// Columns: NONE, MD5, SHA-1, SHA-224, SHA-256, SHA-384, SHA-512.
constexpr rsa_choice_t SIGNATURE_CHOICES[] = {
    {KM_PAD_NONE, {TEE_ALG_RSA_NOPAD}},
    {KM_PAD_RSA_PKCS1_1_5_SIGN,
     {TEE_ALG_RSA_NOPAD, TEE_ALG_RSASSA_PKCS1_V1_5_MD5, TEE_ALG_RSASSA_PKCS1_V1_5_SHA1,
      TEE_ALG_RSASSA_PKCS1_V1_5_SHA224, TEE_ALG_RSASSA_PKCS1_V1_5_SHA256,
      TEE_ALG_RSASSA_PKCS1_V1_5_SHA384, TEE_ALG_RSASSA_PKCS1_V1_5_SHA512}},
    {KM_PAD_RSA_PSS,
     {0, 0, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224,
      TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384,
      TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512}},
};

constexpr rsa_choice_t ENCRYPTION_CHOICES[] = {
    {KM_PAD_NONE, {TEE_ALG_RSA_NOPAD}},
    {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, {TEE_ALG_RSAES_PKCS1_V1_5}},
    {KM_PAD_RSA_OAEP,
     {0, 0, TEE_ALG_RSAES_OAEP_PLATFORM_SHA1, TEE_ALG_RSAES_OAEP_PLATFORM_SHA224,
      TEE_ALG_RSAES_OAEP_PLATFORM_SHA256, TEE_ALG_RSAES_OAEP_PLATFORM_SHA384,
      TEE_ALG_RSAES_OAEP_PLATFORM_SHA512}},
};

// The bits of the modulus in a record that holds one.
uint32_t read_modulus_bits(byte_view key_material) {
  input_cursor in(key_material);
  uint32_t key_bits = 0;
  byte_view field;
  if (!in.read_u32(&key_bits) || !in.read_field(&field)) return 0;
  const byte_view modulus = without_leading_zeros(field);
  return static_cast<uint32_t>(modulus.size()) * 8 -
         static_cast<uint32_t>(std::countl_zero(modulus.front()));
}

keymaster_error_t load(rsa_operation_t* operation, byte_view key_material) {
  if (rsa_resolve_key_data(key_material, &operation->key, &operation->key_bits) != TEE_SUCCESS) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "Resolve key data failed");
  }
  operation->modulus_bits = read_modulus_bits(key_material);
  if (!operation->message.buffer.allocate(operation->key_bits / 8)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return KM_ERROR_OK;
}

keymaster_error_t read_request(rsa_operation_t* operation, bool is_signature,
                               const keymaster_key_param_set_t& params) {
  if (!requested_padding(params, &operation->padding)) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_PADDING");
  }
  if (!requested_digest(params, &operation->message.digest) && is_signature) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "No or too many KM_TAG_DIGEST");
  }
  return KM_ERROR_OK;
}

keymaster_error_t choose(const rsa_operation_t& operation, std::span<const rsa_choice_t> choices,
                         uint32_t* algorithm) {
  const uint32_t digest = operation.message.digest;
  if (digest > KM_DIGEST_SHA_2_512) return KM_ERROR_UNSUPPORTED_DIGEST;
  const auto row = std::ranges::find(choices, operation.padding, &rsa_choice_t::padding);
  if (row == choices.end()) return KM_ERROR_UNSUPPORTED_PADDING_MODE;
  *algorithm = row->algorithms[digest];
  return *algorithm == 0 ? KM_ERROR_INCOMPATIBLE_DIGEST : KM_ERROR_OK;
}

keymaster_error_t check_pss_fits(const rsa_operation_t& operation) {
  if (operation.padding != KM_PAD_RSA_PSS) return KM_ERROR_OK;
  const size_t needed = find_digest(operation.message.digest)->size + PSS_OVERHEAD;
  if (needed <= operation.key_size()) return KM_ERROR_OK;
  return refuse(KM_ERROR_INCOMPATIBLE_DIGEST,
                "Too short key to fit digest, flag and salt, key_size %d, need %d",
                static_cast<int>(operation.key_bits), static_cast<int>(needed * 8));
}

// The digest that signing and verification will use, for its authorisation.
bool signature_digest(const keymaster_key_param_set_t& params, uint32_t* value) {
  uint32_t padding = 0;
  const bool offered = requested_padding(params, &padding) &&
                       std::ranges::find(SIGNATURE_CHOICES, padding, &rsa_choice_t::padding) !=
                           std::end(SIGNATURE_CHOICES);
  return offered && requested_digest(params, value);
}

bool encryption_digest(const keymaster_key_param_set_t& params, uint32_t* value) {
  uint32_t padding = 0;
  return requested_padding(params, &padding) && padding == KM_PAD_RSA_OAEP &&
         requested_digest(params, value);
}

constexpr operation_methods_t RSA_SIGN_METHODS = {
    .create_operation = create_rsa_sign,
    .get_padding = requested_padding,
    .get_block_mode = takes_none,
    .get_digest = signature_digest,
};

constexpr operation_methods_t RSA_VERIFY_METHODS = {
    .create_operation = create_rsa_verify,
    .get_padding = requested_padding,
    .get_block_mode = takes_none,
    .get_digest = signature_digest,
};

constexpr operation_methods_t RSA_ENCRYPT_METHODS = {
    .create_operation = create_rsa_encrypt,
    .get_padding = requested_padding,
    .get_block_mode = takes_none,
    .get_digest = encryption_digest,
};

constexpr operation_methods_t RSA_DECRYPT_METHODS = {
    .create_operation = create_rsa_decrypt,
    .get_padding = requested_padding,
    .get_block_mode = takes_none,
    .get_digest = encryption_digest,
};

const operation_methods_t* rsa_get_operation_methods(uint32_t purpose) {
  switch (purpose) {
    case KM_PURPOSE_ENCRYPT:
      return &RSA_ENCRYPT_METHODS;
    case KM_PURPOSE_DECRYPT:
      return &RSA_DECRYPT_METHODS;
    case KM_PURPOSE_SIGN:
      return &RSA_SIGN_METHODS;
    case KM_PURPOSE_VERIFY:
      return &RSA_VERIFY_METHODS;
    default:
      return nullptr;
  }
}

}  // namespace

const rsa_purpose_t RSA_SIGN = {SIGNATURE_CHOICES, true, TEE_MODE_SIGN, TEE_MODE_DECRYPT};
const rsa_purpose_t RSA_VERIFY = {SIGNATURE_CHOICES, true, TEE_MODE_VERIFY, TEE_MODE_ENCRYPT};
const rsa_purpose_t RSA_ENCRYPT = {ENCRYPTION_CHOICES, false, TEE_MODE_ENCRYPT, TEE_MODE_ENCRYPT};
const rsa_purpose_t RSA_DECRYPT = {ENCRYPTION_CHOICES, false, TEE_MODE_DECRYPT, TEE_MODE_DECRYPT};

outcome rsa_prepare(rsa_operation_t* operation, const rsa_purpose_t& purpose,
                    const begin_request& request) {
  uint32_t algorithm = 0;
  TRY(load(operation, request.key_material));
  TRY(read_request(operation, purpose.is_signature, request.params));
  TRY(choose(*operation, purpose.choices, &algorithm));
  TRY(check_pss_fits(*operation));
  const bool undigested = operation->message.digest == KM_DIGEST_NONE;
  if (purpose.is_signature && !undigested) TRY(operation->message.start_hash());
  const uint32_t mode = undigested ? purpose.undigested_mode : purpose.mode;
  TRY(operation->main.allocate(algorithm, mode, operation->key_bits));
  return operation->main.set_key(operation->key.get());
}

keymaster_error_t rsa_take(operation_t* operation, update_step* step, const char* purpose) {
  auto* record = static_cast<rsa_operation_t*>(operation);
  const uint64_t total = uint64_t{record->message.length} + step->input.size();
  const size_t reserved = record->padding == KM_PAD_RSA_PKCS1_1_5_SIGN ? PKCS1_OVERHEAD : 0;
  if (!record->message.is_hashed() && total + reserved > record->key_size()) {
    return refuse(KM_ERROR_INVALID_INPUT_LENGTH, "Input too long to %s, key_size %d, input %dB",
                  purpose, static_cast<int>(record->key_bits), static_cast<int>(total));
  }
  record->message.append(step->input);
  step->consumed = step->input.size();
  return KM_ERROR_OK;
}

void rsa_build_pkcs1_block(rsa_operation_t* operation) {
  message_t& message = operation->message;
  const byte_span block = message.buffer.span();
  const byte_span front = block.first(message.room());
  right_align(block, message.length);
  std::ranges::fill(front, uint8_t{0xFF});
  front.front() = 0x00;
  front[1] = 0x01;
  front.back() = 0x00;
  message.length = block.size();
}

outcome rsa_crypt(rsa_call call, const rsa_operation_t& operation, byte_view input,
                  heap_buffer* result, size_t* produced) {
  *produced = 0;
  if (!result->allocate(operation.key_size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  auto size = static_cast<tee_size>(result->size());
  TRY(call(operation.main.get(), nullptr, 0, input.data(), static_cast<tee_size>(input.size()),
           result->data(), &size));
  *produced = size;
  return DONE;
}

outcome rsa_settle_crypt(outcome how, const char* failure) {
  if (how.tee == TEE_ERROR_BAD_PARAMETERS) return KM_ERROR_INVALID_ARGUMENT;
  return how.tee == TEE_SUCCESS ? how : fail(how.tee, "%s 0x%08x", failure, how.tee);
}

const algorithm_t RSA_ALGORITHM = {
    .algorithm = KM_ALGORITHM_RSA,
    .name = "RSA",
    .get_operation_methods = rsa_get_operation_methods,
    .generate_key = rsa_generate_key,
    .import_key = rsa_import_key,
    .export_key = rsa_export_key,
    .set_key_info = rsa_set_key_info,
};

}  // namespace keymaster
