// AES encryption.
#include "tee_internal_api.h"

#include <array>

#include "ta/alg/aes/aes_operation.h"

namespace keymaster {
namespace {

void aes_encrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<aes_encrypt_operation_t>(operation);
}

TEE_Result aes_encrypt_update(operation_t* operation, const keymaster_key_param_set_t& params,
                              byte_view input, size_t* consumed, byte_span output, size_t* produced,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<aes_encrypt_operation_t*>(operation);
  *consumed = input.size();
  *produced = 0;
  *km_error = aes_take_associated_data(record, params);
  if (*km_error != KM_ERROR_OK || input.empty()) return TEE_SUCCESS;
  record->data_started = true;
  record->total_input += input.size();
  return aes_feed(record, input, output, produced);
}

// Fills the last block up with as many bytes as are missing, each of that value; a whole block of
// them follows a full one.
TEE_Result put_padding(aes_encrypt_operation_t* operation, byte_span block,
                       keymaster_error_t* km_error) {
  const size_t count = AES_BLOCK_SIZE - operation->total_input % AES_BLOCK_SIZE;
  std::array<uint8_t, AES_BLOCK_SIZE> padding{};
  padding.fill(static_cast<uint8_t>(count));
  size_t produced = 0;
  if (TEE_Result res = aes_feed(operation, byte_view(padding).first(count), block, &produced)) {
    return res;
  }
  if (produced != AES_BLOCK_SIZE) {
    trace_error("Padding input got wrong output length %dB, expected %dB",
                static_cast<int>(produced), static_cast<int>(AES_BLOCK_SIZE));
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

TEE_Result put_tag(const aes_encrypt_operation_t& operation, byte_span tag,
                   keymaster_error_t* km_error) {
  tee_size made = 0;
  auto tag_size = static_cast<tee_size>(tag.size());
  const TEE_Result res =
      TEE_AEEncryptFinal(operation.main.get(), nullptr, 0, nullptr, &made, tag.data(), &tag_size);
  if (res != TEE_SUCCESS) {
    trace_error("AEEncryptFinal failed with 0x%08x\n", res);
    return res;
  }
  if (made != 0) {
    trace_error("AEEncryptFinal make output %dB, expected %dB", static_cast<int>(made), 0);
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  } else if (tag_size != tag.size()) {
    trace_error("AEEncryptFinal make wrong tag size %dB, expected %dB", static_cast<int>(tag_size),
                static_cast<int>(tag.size()));
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

// The data of finish is intentionally not part of the stream, here as in every algorithm: all data
// comes through update.
TEE_Result aes_encrypt_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                              heap_buffer* output, keymaster_key_param_set_t*,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<aes_encrypt_operation_t*>(operation);
  const bool pads = record->padding == KM_PAD_PKCS7;
  if (!pads && record->mode->whole_blocks && record->ends_in_partial_block()) {
    *km_error = KM_ERROR_INVALID_INPUT_LENGTH;
    return TEE_SUCCESS;
  }
  heap_buffer last;
  if (!last.allocate((pads ? AES_BLOCK_SIZE : 0) + record->tag_size())) {
    return KM_FAIL(km_error, KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  TEE_Result res = TEE_SUCCESS;
  if (pads) res = put_padding(record, last.span(), km_error);
  if (failed(res, *km_error)) return res;
  res = record->is_gcm() ? put_tag(*record, last.span(), km_error)
                         : aes_end_cipher(*record, km_error);
  if (failed(res, *km_error)) return res;
  *output = std::move(last);
  return TEE_SUCCESS;
}

}  // namespace

operation_t* create_aes_encrypt(byte_view key_material, const keymaster_key_param_set_t&,
                                const keymaster_key_param_set_t& begin_params,
                                keymaster_key_param_set_t* out_params,
                                keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<aes_encrypt_operation_t>(
      {aes_encrypt_free, aes_encrypt_update, aes_encrypt_finish}, km_error,
      [&](aes_encrypt_operation_t* operation) {
        return aes_prepare(operation, TEE_MODE_ENCRYPT, key_material, begin_params, out_params,
                           km_error);
      });
}

}  // namespace keymaster
