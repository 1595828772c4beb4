// AES in the modes ECB, CBC and CTR.
#include "tee/crypto/block_cipher.h"

#include <algorithm>

#include "tee/crypto/fetched.h"

namespace tee::crypto {
namespace {

cipher_ctx_ptr keyed_context(const key& key, block_mode mode, bool encrypt) {
  cipher_ctx_ptr context(EVP_CIPHER_CTX_new());
  must(context && EVP_CipherInit_ex2(context.get(), cipher_of(mode, key.bits()),
                                     key.secret().data(), nullptr, encrypt ? 1 : 0, nullptr) == 1,
       "EVP_CipherInit_ex2");
  EVP_CIPHER_CTX_set_padding(context.get(), 0);
  return context;
}

}  // namespace

block_cipher::block_cipher(key_ptr key, block_mode mode, bool encrypt)
    : key_(std::move(key)),
      mode_(mode),
      encrypt_(encrypt),
      context_(key_->cipher_contexts.take(use())) {
  if (!context_) context_ = keyed_context(*key_, mode, encrypt);
}

block_cipher::~block_cipher() {
  if (context_) key_->cipher_contexts.give(use(), std::move(context_));
}

void block_cipher::start(std::span<const uint8_t> iv) {
  held_ = 0;
  // Without a cipher and a key: the context keeps its own. ECB has no IV, and any call drops what a
  // message left behind.
  must(EVP_CipherInit_ex2(context_.get(), nullptr, nullptr, iv.empty() ? nullptr : iv.data(), -1,
                          nullptr) == 1,
       "EVP_CipherInit_ex2");
}

size_t block_cipher::output_size(size_t length) const {
  if (mode_ == block_mode::CTR) return length;
  return length - (held_ + length) % AES_BLOCK + held_;
}

void block_cipher::update(std::span<const uint8_t> input, uint8_t* output) {
  if (mode_ != block_mode::CTR) held_ = (held_ + input.size()) % AES_BLOCK;
  update_in_chunks(context_.get(), input, output);
}

void update_in_chunks(EVP_CIPHER_CTX* context, std::span<const uint8_t> input, uint8_t* output) {
  constexpr size_t CHUNK = size_t{1} << 30;
  while (!input.empty()) {
    size_t length = std::min(input.size(), CHUNK);
    int written = 0;
    must(EVP_CipherUpdate(context, output, &written, input.data(), static_cast<int>(length)) == 1,
         "EVP_CipherUpdate");
    if (output) output += written;
    input = input.subspan(length);
  }
}

}  // namespace tee::crypto
