// AES decryption: what it adds to the stream is that the end of the input, which may be a tag or
// padding, is held back.
#include "tee_internal_api.h"

#include <algorithm>

#include "ta/alg/aes/aes_transfer.h"

namespace keymaster {
namespace {

void aes_decrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<aes_decrypt_operation_t>(operation);
}

// How many bytes at the end of the input stay here: as much as may be the tag, or the last block of
// a stream that fills whole blocks with it, which may be padding.
size_t size_of_tail(const aes_decrypt_operation_t& operation, size_t input_size) {
  if (operation.is_gcm()) return std::min(input_size, operation.tag_size());
  const bool holds_back = operation.padding == KM_PAD_PKCS7 && !operation.ends_in_partial_block();
  return holds_back ? std::min(input_size, AES_BLOCK_SIZE) : 0;
}

// GCM: all but the last tag_size() bytes of the stream so far are decrypted: passes on the oldest
// bytes that were held as the tag, as many as `tail_size` new ones push out.
TEE_Result feed_held(aes_decrypt_operation_t* operation, size_t tail_size, aes_transfer* transfer) {
  const size_t needed = operation->tag_held + tail_size;
  if (needed <= operation->tag_size()) return TEE_SUCCESS;
  const size_t count = needed - operation->tag_size();
  uint8_t* tag = operation->tag;
  TRY(transfer->feed({tag, count}));
  std::copy(tag + count, tag + operation->tag_held, tag);
  operation->tag_held -= count;
  return TEE_SUCCESS;
}

// A block of padded text goes straight from the platform into the operation, never through the
// output, which others can write to.
TEE_Result hold_tail(aes_decrypt_operation_t* operation, byte_view tail) {
  if (operation->is_gcm()) {
    copy_bytes(byte_span(operation->tag).subspan(operation->tag_held), tail);
    operation->tag_held += tail.size();
    return TEE_SUCCESS;
  }
  size_t held = 0;
  return aes_feed(operation, tail, operation->held_block, &held);
}

outcome decrypt_data(aes_decrypt_operation_t* operation, update_step* step) {
  const byte_view input = step->input;
  // PKCS7: the block that an earlier update held back turns out not to be the last.
  const bool releases_block = operation->padding == KM_PAD_PKCS7 && operation->total_input != 0 &&
                              !operation->ends_in_partial_block();
  operation->data_started = true;
  operation->total_input += input.size();
  uint8_t room[std::max(AES_MAX_TAG_SIZE, AES_BLOCK_SIZE)];
  const byte_span tail = byte_span(room).first(size_of_tail(*operation, input.size()));
  copy_bytes(tail, input.last(tail.size()));
  aes_transfer transfer(operation, step, input.first(input.size() - tail.size()));
  TRY(transfer.start());
  if (releases_block && !transfer.put(operation->held_block)) {
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  if (operation->is_gcm()) TRY(feed_held(operation, tail.size(), &transfer));
  TRY(transfer.feed_body());
  return hold_tail(operation, tail);
}

outcome aes_decrypt_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  auto* record = static_cast<aes_decrypt_operation_t*>(operation);
  TRY(aes_take_associated_data(record, step->params));
  if (!step->input.empty()) TRY(decrypt_data(record, step));
  step->consumed = step->input.size();
  return DONE;
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
  if (pads && (record->ends_in_partial_block() || record->total_input == 0)) {
    return refuse(KM_ERROR_INVALID_INPUT_LENGTH, "Input data not align to block size");
  }
  if (record->mode->whole_blocks && record->ends_in_partial_block()) {
    return KM_ERROR_INVALID_INPUT_LENGTH;
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
