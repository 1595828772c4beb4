// What the files of AES operations share: the records, and the steps that encryption and decryption
// have in common.
#pragma once

#include "ta/alg/aes/aes.h"

namespace keymaster {

constexpr size_t AES_BLOCK_SIZE = 16;
constexpr size_t AES_MAX_TAG_SIZE = 16;

// aes_mode_t: what belongs to one block mode.
struct aes_mode_t {
  uint32_t block_mode;  // KM_MODE_*
  uint32_t algorithm;   // TEE_ALG_AES_*
  size_t nonce_size;    // bytes; 0 when the mode takes no nonce
  bool whole_blocks;    // data must fill whole blocks, with padding if asked for
};

// aes_encrypt_operation_t: an encryption. Lives from create to free.
struct aes_encrypt_operation_t : operation_t {
  static constexpr char TYPE_NAME[] = "aes_encrypt_operation_t";

  tee_operation main;
  tee_object key;
  const aes_mode_t* mode = nullptr;
  uint32_t padding = KM_PAD_NONE;  // NONE, or PKCS7 where the mode works on whole blocks
  uint32_t key_bits = 0;
  uint32_t mac_bits = 0;      // GCM: at most 128, whole bytes
  bool data_started = false;  // associated data may no longer come
  uint64_t total_input = 0;   // bytes given to update

  bool is_gcm() const { return mode->block_mode == KM_MODE_GCM; }
  size_t tag_size() const { return is_gcm() ? mac_bits / 8 : 0; }
  bool ends_in_partial_block() const { return total_input % AES_BLOCK_SIZE != 0; }
  int missing() const { return (key ? 0 : 1) + (main ? 0 : 1); }
};

// aes_decrypt_operation_t: a decryption. It is traced under the name of the encryption, which is
// intended. At any time the stream's end may have been seen, so what may be the tag (GCM) or the
// padding (PKCS7) stays here until more input shows that it is neither.
struct aes_decrypt_operation_t : aes_encrypt_operation_t {
  uint8_t tag[AES_MAX_TAG_SIZE] = {};       // the last tag_held bytes of the ciphertext stream
  size_t tag_held = 0;                      // at most tag_size()
  uint8_t held_block[AES_BLOCK_SIZE] = {};  // PKCS7: plaintext, filled when total_input is a
                                            // multiple of the block size, and not 0
};

// aes_prepare: everything of create that can fail after the record is there; `tee_mode` is
// TEE_MODE_ENCRYPT or TEE_MODE_DECRYPT. Codes as create_aes_encrypt.
outcome aes_prepare(aes_encrypt_operation_t* operation, uint32_t tee_mode,
                    const begin_request& request);

// aes_take_associated_data: hands the KM_TAG_ASSOCIATED_DATA of an update to the platform.
// KM_ERROR_INVALID_TAG outside GCM, after the first data, or for more than one.
[[nodiscard]] keymaster_error_t aes_take_associated_data(aes_encrypt_operation_t* operation,
                                                         const keymaster_key_param_set_t& params);

// aes_feed: passes `input` through the cipher into `output`, behind the *produced bytes that are
// already there, and adds what comes out to *produced. TEE_ERROR_SHORT_BUFFER when it does not fit.
[[nodiscard]] TEE_Result aes_feed(aes_encrypt_operation_t* operation, byte_view input,
                                  byte_span output, size_t* produced);

// aes_end_cipher: ends a stream of any mode but GCM. All data is out by then: -1000 if the platform
// makes more.
outcome aes_end_cipher(const aes_encrypt_operation_t& operation);

}  // namespace keymaster
