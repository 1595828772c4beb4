// AES-GCM.
#include "tee/crypto/aead.h"

#include <array>
#include <openssl/core_names.h>

#include "tee/crypto/block_cipher.h"
#include "tee/crypto/fetched.h"

namespace tee::crypto {
namespace {

// Apart from the numbers under which block_cipher keeps its contexts.
uint64_t use_of(bool encrypt) {
  return static_cast<uint64_t>(block_mode::GCM) * 2 + (encrypt ? 1 : 0);
}

// The tag alone, as parameters of a context.
std::array<OSSL_PARAM, 2> tag_params(uint8_t* tag, size_t length) {
  return {OSSL_PARAM_construct_octet_string(OSSL_CIPHER_PARAM_AEAD_TAG, tag, length),
          OSSL_PARAM_construct_end()};
}

cipher_ctx_ptr keyed_context(const key& key, bool encrypt) {
  cipher_ctx_ptr context(EVP_CIPHER_CTX_new());
  must(context && EVP_CipherInit_ex2(context.get(), cipher_of(block_mode::GCM, key.bits()),
                                     key.secret().data(), nullptr, encrypt ? 1 : 0, nullptr) == 1,
       "EVP_CipherInit_ex2");
  return context;
}

}  // namespace

aead::aead(key_ptr key, bool encrypt)
    : key_(std::move(key)),
      encrypt_(encrypt),
      context_(key_->cipher_contexts.take(use_of(encrypt))) {
  if (!context_) context_ = keyed_context(*key_, encrypt);
}

aead::~aead() {
  if (!context_ || nonce_length_ != USUAL_NONCE) return;
  key_->cipher_contexts.give(use_of(encrypt_), std::move(context_));
}

void aead::start(std::span<const uint8_t> nonce, uint32_t tag_bits) {
  EVP_CIPHER_CTX* context = context_.get();
  if (nonce.size() != nonce_length_) {
    must(EVP_CIPHER_CTX_ctrl(context, EVP_CTRL_AEAD_SET_IVLEN, static_cast<int>(nonce.size()),
                             nullptr) == 1,
         "EVP_CTRL_AEAD_SET_IVLEN");
    nonce_length_ = nonce.size();
  }
  // Without a cipher and a key: the context keeps its own.
  must(EVP_CipherInit_ex2(context, nullptr, nullptr, nonce.data(), -1, nullptr) == 1,
       "EVP_CipherInit_ex2");
  tag_length_ = tag_bits / 8;
  processed_ = 0;
}

void aead::add_associated_data(std::span<const uint8_t> bytes) {
  update_in_chunks(context_.get(), bytes, nullptr);
}

void aead::update(std::span<const uint8_t> input, uint8_t* output) {
  processed_ += input.size();
  update_in_chunks(context_.get(), input, output);
}

void aead::make_tag(uint8_t* tag) {
  int written = 0;
  uint8_t none[AES_BLOCK];
  auto params = tag_params(tag, tag_length_);
  must(EVP_CipherFinal_ex(context_.get(), none, &written) == 1 &&
           EVP_CIPHER_CTX_get_params(context_.get(), params.data()) == 1,
       "EVP_CipherFinal_ex");
}

bool aead::check_tag(std::span<const uint8_t> tag) {
  if (tag.size() != tag_length_) return false;
  // The tag is an input here; only the parameter's type is not const.
  const auto params = tag_params(const_cast<uint8_t*>(tag.data()), tag.size());
  must(EVP_CIPHER_CTX_set_params(context_.get(), params.data()) == 1, "EVP_CIPHER_CTX_set_params");
  int written = 0;
  uint8_t none[AES_BLOCK];
  bool authentic = EVP_CipherFinal_ex(context_.get(), none, &written) == 1;
  if (!authentic) forget_errors();
  return authentic;
}

}  // namespace tee::crypto
