// AES encryption.
#include "tee_internal_api.h"

#include <array>

#include "ta/alg/aes/aes_transfer.h"

namespace keymaster {
namespace {

void aes_encrypt_free(operation_t* operation) {
  const trace_scope scope;
  free_operation<aes_encrypt_operation_t>(operation);
}

outcome encrypt_data(aes_encrypt_operation_t* operation, update_step* step) {
  operation->data_started = true;
  operation->total_input += step->input.size();
  aes_transfer transfer(operation, step, step->input);
  TRY(transfer.start());
  return transfer.feed_body();
}

outcome aes_encrypt_update(operation_t* operation, update_step* step) {
  const trace_scope scope;
  auto* record = static_cast<aes_encrypt_operation_t*>(operation);
  TRY(aes_take_associated_data(record, step->params));
  if (!step->input.empty()) TRY(encrypt_data(record, step));
  step->consumed = step->input.size();
  return DONE;
}

// Fills the last block up with as many bytes as are missing, each of that value; a whole block of
// them follows a full one.
outcome put_padding(aes_encrypt_operation_t* operation, byte_span block) {
  const size_t count = AES_BLOCK_SIZE - operation->total_input % AES_BLOCK_SIZE;
  std::array<uint8_t, AES_BLOCK_SIZE> padding{};
  padding.fill(static_cast<uint8_t>(count));
  size_t produced = 0;
  TRY(aes_feed(operation, byte_view(padding).first(count), block, &produced));
  if (produced == AES_BLOCK_SIZE) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "Padding input got wrong output length %dB, expected %dB",
                static_cast<int>(produced), static_cast<int>(AES_BLOCK_SIZE));
}

outcome put_tag(const aes_encrypt_operation_t& operation, byte_span tag) {
  tee_size made = 0;
  auto tag_size = static_cast<tee_size>(tag.size());
  TRY(checked(
      TEE_AEEncryptFinal(operation.main.get(), nullptr, 0, nullptr, &made, tag.data(), &tag_size),
      "AEEncryptFinal"));
  if (made != 0) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "AEEncryptFinal make output %dB, expected %dB",
                  static_cast<int>(made), 0);
  }
  if (tag_size == tag.size()) return DONE;
  return refuse(KM_ERROR_UNKNOWN_ERROR, "AEEncryptFinal make wrong tag size %dB, expected %dB",
                static_cast<int>(tag_size), static_cast<int>(tag.size()));
}

// The data of finish is intentionally not part of the stream, here as in every algorithm: all data
// comes through update.
outcome aes_encrypt_finish(operation_t* operation, finish_step* step) {
  const trace_scope scope;
  auto* record = static_cast<aes_encrypt_operation_t*>(operation);
  const bool pads = record->padding == KM_PAD_PKCS7;
  if (!pads && record->mode->whole_blocks && record->ends_in_partial_block()) {
    return KM_ERROR_INVALID_INPUT_LENGTH;
  }
  heap_buffer last;
  if (!last.allocate((pads ? AES_BLOCK_SIZE : 0) + record->tag_size())) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "Out of memory");
  }
  if (pads) TRY(put_padding(record, last.span()));
  TRY(record->is_gcm() ? put_tag(*record, last.span()) : aes_end_cipher(*record));
  step->output = std::move(last);
  return DONE;
}

}  // namespace

keymaster_error_t create_aes_encrypt(const begin_request& request, operation_t** operation) {
  const trace_scope scope;
  return create_operation_object<aes_encrypt_operation_t>(
      {aes_encrypt_free, aes_encrypt_update, aes_encrypt_finish}, operation,
      [&](aes_encrypt_operation_t* record) {
        return aes_prepare(record, TEE_MODE_ENCRYPT, request);
      });
}

}  // namespace keymaster
