// Public-key structures of libcrypto: made from numbers, read back into numbers, and contexts for
// operations with them.
#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "tee/crypto/key.h"

namespace tee::crypto {

// A list of parameters for libcrypto that owns and wipes what it carries.
class param_list {
 public:
  void add_number(const char* name, std::span<const uint8_t> big_endian);
  void add_bytes(const char* name, std::span<const uint8_t> bytes);
  void add_text(const char* name, const char* text);

  // end: the list as libcrypto takes it; valid until the list changes.
  OSSL_PARAM* end();

 private:
  std::vector<secret_bytes> values_;  // moving one leaves its bytes in place
  std::vector<OSSL_PARAM> params_;
};

// pkey_from: a key of `algorithm` ("RSA", "EC") from its parameters; `selection` as
// EVP_PKEY_fromdata has it. Null when libcrypto does not accept them.
pkey_ptr pkey_from(const char* algorithm, int selection, param_list params);

// to_bignum, to_bytes: numbers in and out. to_bytes pads with leading zeros to `length` bytes.
bignum_ptr to_bignum(std::span<const uint8_t> big_endian);
secret_bytes to_bytes(const BIGNUM* number, size_t length);
inline secret_bytes to_bytes(const BIGNUM* number) {
  return to_bytes(number, static_cast<size_t>(BN_num_bytes(number)));
}

// from_native: a number that libcrypto wrote into a parameter, as big-endian bytes of that length.
secret_bytes from_native(std::span<const uint8_t> native);

// number_of: a number of the key by libcrypto's name.
bignum_ptr number_of(const EVP_PKEY* pkey, const char* name);

// A context made ready for one use of a key: a spare one of the key, or a new one. Goes back to the
// key's spares.
class pkey_context {
 public:
  // `prepare(EVP_PKEY_CTX*)` initialises a new context and says whether that worked.
  template <typename Prepare>
  pkey_context(key& owner, uint32_t algorithm, uint32_t mode, Prepare&& prepare)
      : owner_(owner), use_((uint64_t{algorithm} << 8) | mode) {
    context_ = owner.pkey_contexts.take(use_);
    if (context_) return;
    context_.reset(EVP_PKEY_CTX_new_from_pkey(nullptr, owner.pkey(), nullptr));
    must(context_ && prepare(context_.get()), "preparing a key");
  }
  pkey_context(const pkey_context&) = delete;
  pkey_context& operator=(const pkey_context&) = delete;
  ~pkey_context() {
    if (context_) owner_.pkey_contexts.give(use_, std::move(context_));
  }

  EVP_PKEY_CTX* get() const { return context_.get(); }

 private:
  key& owner_;
  uint64_t use_;
  pkey_ctx_ptr context_;
};

}  // namespace tee::crypto
