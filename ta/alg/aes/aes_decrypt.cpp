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
TEE_Result feed_held(aes_decrypt_operation_t* operation, size_t count, update_step* step) {
  uint8_t* tag = operation->tag;
  TRY(aes_feed(operation, {tag, count}, step->output, &step->produced));
  std::copy(tag + count, tag + operation->tag_held, tag);
  operation->tag_held -= count;
  return TEE_SUCCESS;
}

// GCM: all but the last tag_size() bytes of the stream so far are decrypted.
TEE_Result update_tagged(aes_decrypt_operation_t* operation, update_step* step) {
  const byte_view input = step->input;
  const size_t tag_size = operation->tag_size();
  const byte_view tail = input.last(std::min(input.size(), tag_size));
  const size_t overflow = operation->tag_held + tail.size();
  TRY(feed_held(operation, overflow > tag_size ? overflow - tag_size : 0, step));
  const byte_view body = input.first(input.size() - tail.size());
  TRY(aes_feed(operation, body, step->output, &step->produced));
  copy_bytes(byte_span(operation->tag).subspan(operation->tag_held), tail);
  operation->tag_held += tail.size();
  return TEE_SUCCESS;
}

// PKCS7: the block that an earlier update held back turns out not to be the last.
keymaster_error_t release_held_block(const aes_decrypt_operation_t& operation, update_step* step) {
  if (operation.total_input == 0 || operation.ends_in_partial_block()) return KM_ERROR_OK;
  if (step->output.size() < AES_BLOCK_SIZE) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  copy_bytes(step->output, operation.held_block);
  step->produced = AES_BLOCK_SIZE;
  return KM_ERROR_OK;
}

// PKCS7: when the stream so far, this input included, fills whole blocks, the last one goes
// straight into the operation, never through `output`, which others can write to.
TEE_Result update_padded(aes_decrypt_operation_t* operation, update_step* step) {
  const byte_view input = step->input;
  const bool holds_back = !operation->ends_in_partial_block();
  const size_t body = input.size() - (holds_back ? std::min(input.size(), AES_BLOCK_SIZE) : 0);
  TRY(aes_feed(operation, input.first(body), step->output, &step->produced));
  size_t held = 0;
  return aes_feed(operation, input.subspan(body), operation->held_block, &held);
}

outcome aes_decrypt_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  auto* record = static_cast<aes_decrypt_operation_t*>(operation);
  step->consumed = step->input.size();
  TRY(aes_take_associated_data(record, step->params));
  if (step->input.empty()) return DONE;
  const bool pads = record->padding == KM_PAD_PKCS7;
  if (pads) TRY(release_held_block(*record, step));
  record->data_started = true;
  record->total_input += step->input.size();
  if (record->is_gcm()) return update_tagged(record, step);
  if (pads) return update_padded(record, step);
  return aes_feed(record, step->input, step->output, &step->produced);
}

// A stream shorter than a tag is refused like one with a wrong tag.
outcome check_tag(aes_decrypt_operation_t* operation) {
  if (operation->tag_held != operation->tag_size()) return KM_ERROR_VERIFICATION_FAILED;
  tee_size made = 0;
  const TEE_Result res =
      TEE_AEDecryptFinal(operation->main.get(), nullptr, 0, nullptr, &made, operation->tag,
                         static_cast<tee_size>(operation->tag_held));
  if (res == TEE_ERROR_MAC_INVALID) return KM_ERROR_VERIFICATION_FAILED;
  TRY(checked(res, "AEDecryptFinal"));
  if (made == 0) return DONE;
  // The name is that of the encryption's call, which is intended.
  return refuse(KM_ERROR_UNKNOWN_ERROR, "AEEncryptFinal make output %dB", static_cast<int>(made));
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

keymaster_error_t strip_padding(byte_view block, heap_buffer* output) {
  if (!is_padded(block)) return refuse(KM_ERROR_INVALID_ARGUMENT, "Illegal padding");
  if (!output->copy_of(block.first(AES_BLOCK_SIZE - block.back()))) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  return KM_ERROR_OK;
}

outcome aes_decrypt_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<aes_decrypt_operation_t*>(operation);
  if (record->is_gcm()) return check_tag(record);
  const bool pads = record->padding == KM_PAD_PKCS7;
  // The platform must not be asked to end a stream in the middle of a block; and padding is never
  // empty.
  if ((record->mode->whole_blocks && record->ends_in_partial_block()) ||
      (pads && record->total_input == 0)) {
    return refuse(KM_ERROR_INVALID_INPUT_LENGTH, "Input data not align to block size");
  }
  TRY(aes_end_cipher(*record));
  return pads ? strip_padding(record->held_block, &step->output) : KM_ERROR_OK;
}

}  // namespace

keymaster_error_t create_aes_decrypt(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<aes_decrypt_operation_t>(
      {aes_decrypt_free, aes_decrypt_update, aes_decrypt_finish}, operation,
      [&](aes_decrypt_operation_t* record) {
        return aes_prepare(record, TEE_MODE_DECRYPT, request);
      });
}

}  // namespace keymaster
