// What the files of RSA operations share: the records, and the steps that the purposes have in
// common.
#pragma once

#include "ta/alg/message.h"
#include "ta/alg/rsa/rsa.h"

namespace keymaster {

// What PKCS #1 v1.5 adds to a message at least, in bytes (RFC 8017, 7.2.1 and 9.2).
constexpr size_t PKCS1_OVERHEAD = 11;

// rsa_operation_t: an RSA operation. Lives from create to free.
struct rsa_operation_t : operation_t {
  tee_operation main;
  tee_object key;
  message_t message;  // its buffer has the key's size
  uint32_t padding = KM_PAD_NONE;
  uint32_t key_bits = 0;      // whole bytes
  uint32_t modulus_bits = 0;  // exactly

  size_t key_size() const { return message.buffer.size(); }
  int missing() const { return (key ? 0 : 1) + (main ? 0 : 1) + (message.buffer ? 0 : 1); }
};

// rsa_sign_operation_t: a SOTER key's operation keeps its whole message.
struct rsa_sign_operation_t : rsa_operation_t {
  static constexpr char TYPE_NAME[] = "rsa_sign_operation_t";

  heap_buffer soter_message;  // its size is the capacity; none unless the key is a SOTER key
  size_t soter_length = 0;    // bytes held
};

struct rsa_verify_operation_t : rsa_operation_t {
  static constexpr char TYPE_NAME[] = "rsa_verify_operation_t";
};

struct rsa_encrypt_operation_t : rsa_operation_t {
  static constexpr char TYPE_NAME[] = "rsa_encrypt_operation_t";
};

struct rsa_decrypt_operation_t : rsa_operation_t {
  static constexpr char TYPE_NAME[] = "rsa_decrypt_operation_t";
};

// rsa_choice_t: the platform algorithms of one padding, by KM_DIGEST_* value; 0 refuses the digest.
struct rsa_choice_t {
  uint32_t padding;
  uint32_t algorithms[KM_DIGEST_SHA_2_512 + 1];
};

// rsa_purpose_t: how a purpose is begun.
struct rsa_purpose_t {
  std::span<const rsa_choice_t> choices;
  bool is_signature;         // hashes its data, and wants a digest to be named, if only NONE
  uint32_t mode;             // TEE_MODE_*
  uint32_t undigested_mode;  // with KM_DIGEST_NONE
};

extern const rsa_purpose_t RSA_SIGN;
extern const rsa_purpose_t RSA_VERIFY;
extern const rsa_purpose_t RSA_ENCRYPT;
extern const rsa_purpose_t RSA_DECRYPT;

// rsa_prepare: everything of create that can fail after the record is there. Codes as
// create_rsa_sign.
outcome rsa_prepare(rsa_operation_t* operation, const rsa_purpose_t& purpose,
                    const begin_request& request);

// rsa_take: the update of every purpose: takes all of the input into the message. What is kept,
// with its padding, may not outgrow the key: KM_ERROR_INVALID_INPUT_LENGTH, and none is taken.
// `purpose` stands in the message, as in "Input too long to sign".
[[nodiscard]] keymaster_error_t rsa_take(operation_t* operation, update_step* step,
                                         const char* purpose);

// rsa_build_pkcs1_block: turns the kept message into the EMSA-PKCS1-v1_5 block (RFC 8017, 9.2) in
// which it stands for the whole DigestInfo.
void rsa_build_pkcs1_block(rsa_operation_t* operation);

// pkcs1_size: how many bytes the block of an RSASSA-PKCS1-v1_5 signature takes at least.
size_t pkcs1_size(const digest_t& digest);

// rsa_sign_digest: signs the message's digest; `salt` is a TEE_PSS_SALT_* and counts for PSS alone.
// The signature has room for it and is cut to what was made. TEE_ERROR_BAD_PARAMETERS: the digest
// does not fit the key, which a platform need not answer and is not asked.
[[nodiscard]] TEE_Result rsa_sign_digest(const rsa_operation_t& operation, uint32_t salt,
                                         heap_buffer* signature);

// rsa_crypt: runs TEE_AsymmetricEncrypt or TEE_AsymmetricDecrypt on `input`; *result is made, of
// the key's size, and *produced tells how much of it the platform has filled. -41: out of memory.
// The platform's code is not traced.
using rsa_call = decltype(TEE_AsymmetricEncrypt);
outcome rsa_crypt(rsa_call call, const rsa_operation_t& operation, byte_view input,
                  heap_buffer* result, size_t* produced);

// rsa_settle_crypt: what the outcome of rsa_crypt means where its input is the client's:
// KM_ERROR_INVALID_ARGUMENT when the platform refuses it; any other code of the platform is traced
// behind `failure` and passed on.
outcome rsa_settle_crypt(outcome how, const char* failure);

}  // namespace keymaster
