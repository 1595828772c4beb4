// AES decryption: what it adds to the stream is that the end of the input, which may be a tag or
// padding, is held back.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/aes/aes_operation.h"

namespace keymaster {
namespace {

void aes_decrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<aes_decrypt_operation_t>(operation);
}

// Passes on the oldest `count` bytes that were held as the tag.
TEE_Result feed_held(aes_decrypt_operation_t* operation, size_t count, byte_span output,
                     size_t* produced) {
  uint8_t* tag = operation->tag;
  if (TEE_Result res = aes_feed(operation, {tag, count}, output, produced)) return res;
  std::copy(tag + count, tag + operation->tag_held, tag);
  operation->tag_held -= count;
  return TEE_SUCCESS;
}

// GCM: all but the last tag_size() bytes of the stream so far are decrypted.
TEE_Result update_tagged(aes_decrypt_operation_t* operation, byte_view input, byte_span output,
                         size_t* produced) {
  const size_t tag_size = operation->tag_size();
  const byte_view tail = input.last(std::min(input.size(), tag_size));
  const size_t overflow = operation->tag_held + tail.size();
  const size_t due = overflow > tag_size ? overflow - tag_size : 0;
  if (TEE_Result res = feed_held(operation, due, output, produced)) return res;
  const byte_view body = input.first(input.size() - tail.size());
  if (TEE_Result res = aes_feed(operation, body, output, produced)) return res;
  copy_bytes(byte_span(operation->tag).subspan(operation->tag_held), tail);
  operation->tag_held += tail.size();
  return TEE_SUCCESS;
}

// PKCS7: the block that an earlier update held back turns out not to be the last.
keymaster_error_t release_held_block(const aes_decrypt_operation_t& operation, byte_span output,
                                     size_t* produced) {
  if (operation.total_input == 0 || operation.ends_in_partial_block()) return KM_ERROR_OK;
  if (output.size() < AES_BLOCK_SIZE) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  copy_bytes(output, operation.held_block);
  *produced = AES_BLOCK_SIZE;
  return KM_ERROR_OK;
}

// PKCS7: when the stream so far, this input included, fills whole blocks, the last one goes
// straight into the operation, never through `output`, which others can write to.
TEE_Result update_padded(aes_decrypt_operation_t* operation, byte_view input, byte_span output,
                         size_t* produced) {
  const bool holds_back = !operation->ends_in_partial_block();
  const size_t tail = holds_back ? std::min(input.size(), AES_BLOCK_SIZE) : 0;
  const size_t body = input.size() - tail;
  if (TEE_Result res = aes_feed(operation, input.first(body), output, produced)) return res;
  size_t held = 0;
  return aes_feed(operation, input.subspan(body), operation->held_block, &held);
}

TEE_Result aes_decrypt_update(operation_t* operation, const keymaster_key_param_set_t& params,
                              byte_view input, size_t* consumed, byte_span output, size_t* produced,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<aes_decrypt_operation_t*>(operation);
  *consumed = input.size();
  *produced = 0;
  *km_error = aes_take_associated_data(record, params);
  if (*km_error != KM_ERROR_OK || input.empty()) return TEE_SUCCESS;
  const bool pads = record->padding == KM_PAD_PKCS7;
  if (pads) *km_error = release_held_block(*record, output, produced);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  record->data_started = true;
  record->total_input += input.size();
  if (record->is_gcm()) return update_tagged(record, input, output, produced);
  if (pads) return update_padded(record, input, output, produced);
  return aes_feed(record, input, output, produced);
}

// A stream shorter than a tag is refused like one with a wrong tag.
TEE_Result check_tag(aes_decrypt_operation_t* operation, keymaster_error_t* km_error) {
  TEE_Result res = TEE_ERROR_MAC_INVALID;
  tee_size made = 0;
  if (operation->tag_held == operation->tag_size()) {
    res = TEE_AEDecryptFinal(operation->main.get(), nullptr, 0, nullptr, &made, operation->tag,
                             static_cast<tee_size>(operation->tag_held));
  }
  if (res == TEE_ERROR_MAC_INVALID) {
    *km_error = KM_ERROR_VERIFICATION_FAILED;
    return TEE_SUCCESS;
  }
  if (res != TEE_SUCCESS) {
    trace_error("AEDecryptFinal failed with 0x%08x\n", res);
    return res;
  }
  if (made != 0) {
    // The name is that of the encryption's call, which is intended.
    trace_error("AEEncryptFinal make output %dB", static_cast<int>(made));
    *km_error = KM_ERROR_UNKNOWN_ERROR;
  }
  return TEE_SUCCESS;
}

// Whether the last bytes of the block are the padding that its last byte announces. A pad byte of 0
// is accepted, which is intended: the check is only an upper bound. The time taken does not depend
// on the block.
bool is_padded(byte_view block) {
  const uint32_t count = block.back();
  uint32_t wrong = count > AES_BLOCK_SIZE ? 1 : 0;
  for (uint32_t i = 1; i <= AES_BLOCK_SIZE; i++) {
    const uint32_t is_padding = (i - 1 - count) >> 31;  // 1 when i <= count
    wrong |= is_padding * (block[AES_BLOCK_SIZE - i] ^ count);
  }
  return wrong == 0;
}

TEE_Result strip_padding(const aes_decrypt_operation_t& operation, heap_buffer* output,
                         keymaster_error_t* km_error) {
  const byte_view block = operation.held_block;
  if (!is_padded(block)) {
    trace_error("Illegal padding");
    *km_error = KM_ERROR_INVALID_ARGUMENT;
  } else if (!output->copy_of(block.first(AES_BLOCK_SIZE - block.back()))) {
    trace_error("Out of memory");
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return TEE_SUCCESS;
}

TEE_Result aes_decrypt_finish(operation_t* operation, const keymaster_key_param_set_t&, byte_view,
                              heap_buffer* output, keymaster_key_param_set_t*,
                              keymaster_error_t* km_error) {
  const trace_scope scope;
  auto* record = static_cast<aes_decrypt_operation_t*>(operation);
  if (record->is_gcm()) return check_tag(record, km_error);
  const bool pads = record->padding == KM_PAD_PKCS7;
  // The platform must not be asked to end a stream in the middle of a block; and padding is never
  // empty.
  if ((record->mode->whole_blocks && record->ends_in_partial_block()) ||
      (pads && record->total_input == 0)) {
    return KM_FAIL(km_error, KM_ERROR_INVALID_INPUT_LENGTH, "Input data not align to block size");
  }
  const TEE_Result res = aes_end_cipher(*record, km_error);
  if (failed(res, *km_error) || !pads) return res;
  return strip_padding(*record, output, km_error);
}

}  // namespace

operation_t* create_aes_decrypt(byte_view key_material, const keymaster_key_param_set_t&,
                                const keymaster_key_param_set_t& begin_params,
                                keymaster_key_param_set_t* out_params,
                                keymaster_error_t* km_error) {
  const trace_scope scope;
  return create_operation_object<aes_decrypt_operation_t>(
      {aes_decrypt_free, aes_decrypt_update, aes_decrypt_finish}, km_error,
      [&](aes_decrypt_operation_t* operation) {
        return aes_prepare(operation, TEE_MODE_DECRYPT, key_material, begin_params, out_params,
                           km_error);
      });
}

}  // namespace keymaster
