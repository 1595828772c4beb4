// RSA operations.
#include "tee/crypto/rsa.h"

#include <algorithm>
#include <limits>
#include <openssl/core_names.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "tee/crypto/fetched.h"
#include "tee/crypto/pkey.h"

namespace tee::crypto {
namespace {

constexpr size_t PKCS1_OVERHEAD = 11;  // of RFC 8017, 7.2.1, in bytes

int libcrypto_padding(rsa_padding padding) {
  switch (padding) {
    case rsa_padding::NONE:
      return RSA_NO_PADDING;
    case rsa_padding::PKCS1:
      return RSA_PKCS1_PADDING;
    case rsa_padding::OAEP:
      return RSA_PKCS1_OAEP_PADDING;
    case rsa_padding::PSS:
      return RSA_PKCS1_PSS_PADDING;
  }
  return 0;
}

bool set_padding(EVP_PKEY_CTX* context, const algorithm& row) {
  return EVP_PKEY_CTX_set_rsa_padding(context, libcrypto_padding(row.padding)) == 1;
}

// From 3.2 on libcrypto answers wrong padding with made-up bytes unless it is told not to.
bool refuse_wrong_padding(EVP_PKEY_CTX* context) {
  constexpr const char* MADE_UP_BYTES = "implicit-rejection";
  const OSSL_PARAM* known = EVP_PKEY_CTX_settable_params(context);
  if (!known || !OSSL_PARAM_locate_const(known, MADE_UP_BYTES)) return true;
  unsigned int off = 0;
  const OSSL_PARAM params[] = {OSSL_PARAM_construct_uint(MADE_UP_BYTES, &off),
                               OSSL_PARAM_construct_end()};
  return EVP_PKEY_CTX_set_params(context, params) == 1;
}

bool set_oaep(EVP_PKEY_CTX* context, const algorithm& row, const oaep_options& options) {
  const hash mask = options.mask_digest == hash::NONE ? row.digest : options.mask_digest;
  if (EVP_PKEY_CTX_set_rsa_oaep_md(context, digest_of(row.digest)) != 1 ||
      EVP_PKEY_CTX_set_rsa_mgf1_md(context, digest_of(mask)) != 1) {
    return false;
  }
  if (options.label.empty()) return true;
  void* label = OPENSSL_memdup(options.label.data(), options.label.size());
  const int length = static_cast<int>(options.label.size());
  if (EVP_PKEY_CTX_set0_rsa_oaep_label(context, label, length) == 1) return true;
  OPENSSL_free(label);
  return false;
}

// One way to encrypt or decrypt.
struct encryption {
  const algorithm& row;
  uint32_t mode;
  const oaep_options& oaep;
};

bool prepare_encryption(EVP_PKEY_CTX* context, const encryption& how) {
  const bool encrypts = how.mode == TEE_MODE_ENCRYPT;
  const int ready = encrypts ? EVP_PKEY_encrypt_init(context) : EVP_PKEY_decrypt_init(context);
  if (ready != 1 || !set_padding(context, how.row)) return false;
  if (how.row.padding == rsa_padding::PKCS1) return encrypts || refuse_wrong_padding(context);
  return how.row.padding != rsa_padding::OAEP || set_oaep(context, how.row, how.oaep);
}

bool prepare_signature(EVP_PKEY_CTX* context, const algorithm& row, uint32_t mode) {
  int ready = mode == TEE_MODE_SIGN ? EVP_PKEY_sign_init(context) : EVP_PKEY_verify_init(context);
  const EVP_MD* digest = digest_of(row.digest);
  return ready == 1 && set_padding(context, row) &&
         EVP_PKEY_CTX_set_signature_md(context, digest) == 1 &&
         (row.padding != rsa_padding::PSS || EVP_PKEY_CTX_set_rsa_mgf1_md(context, digest) == 1);
}

bool set_salt(EVP_PKEY_CTX* context, const algorithm& row, uint32_t mode, pss_salt salt) {
  if (row.padding != rsa_padding::PSS) return true;
  int length = RSA_PSS_SALTLEN_DIGEST;
  if (salt == TEE_PSS_SALT_MAX_LENGTH) {
    length = mode == TEE_MODE_SIGN ? RSA_PSS_SALTLEN_MAX : RSA_PSS_SALTLEN_AUTO;
  } else if (salt && salt != TEE_PSS_SALT_DIGEST_LENGTH) {
    if (*salt > std::numeric_limits<int>::max()) return false;
    length = static_cast<int>(*salt);
  }
  return EVP_PKEY_CTX_set_rsa_pss_saltlen(context, length) == 1;
}

// Brings a raw input to the modulus' length; false unless it is a number below the modulus.
bool pad_raw(const key& rsa_key, std::span<const uint8_t> input, secret_bytes* block) {
  size_t length = modulus_length(rsa_key);
  if (input.size() > length) return false;
  block->assign(length - input.size(), 0);
  block->insert(block->end(), input.begin(), input.end());
  // Both are as long as the modulus, so that the order of bytes is the order of numbers. The
  // outcome is public: it is the call's result.
  const secret_bytes& modulus = rsa_key.find(TEE_ATTR_RSA_MODULUS)->bytes;
  return std::lexicographical_compare(block->begin(), block->end(), modulus.begin(), modulus.end());
}

void strip_raw(secret_bytes* number) {
  auto significant = without_leading_zeros(*number);
  size_t zeros = number->size() - significant.size();
  if (zeros == number->size()) --zeros;
  number->erase(number->begin(), number->begin() + static_cast<ptrdiff_t>(zeros));
}

size_t longest_message(const key& rsa_key, const algorithm& row) {
  size_t overhead =
      row.padding == rsa_padding::PKCS1 ? PKCS1_OVERHEAD : 2 * length_of(row.digest) + 2;
  size_t length = modulus_length(rsa_key);
  return length > overhead ? length - overhead : 0;
}

using crypt_function = int (*)(EVP_PKEY_CTX*, unsigned char*, size_t*, const unsigned char*,
                               size_t);

// Runs one encryption or decryption whose input was checked as far as it can be.
TEE_Result run(EVP_PKEY_CTX* context, const encryption& how, std::span<const uint8_t> input,
               secret_bytes* output) {
  crypt_function crypt = how.mode == TEE_MODE_ENCRYPT ? EVP_PKEY_encrypt : EVP_PKEY_decrypt;
  size_t written = output->size();
  // A null pointer would ask for the length only, and an empty message may have one.
  const uint8_t nothing = 0;
  const uint8_t* data = input.empty() ? &nothing : input.data();
  if (crypt(context, output->data(), &written, data, input.size()) != 1) {
    forget_errors();
    return TEE_ERROR_BAD_PARAMETERS;
  }
  output->resize(written);
  return TEE_SUCCESS;
}

TEE_Result crypt(key& rsa_key, const encryption& how, std::span<const uint8_t> input,
                 secret_bytes* result) {
  secret_bytes output(modulus_length(rsa_key));
  const auto prepare = [&](EVP_PKEY_CTX* fresh) { return prepare_encryption(fresh, how); };
  TEE_Result res = TEE_SUCCESS;
  if (how.oaep.usual()) {
    pkey_context context(rsa_key, how.row.id, how.mode, prepare);
    res = run(context.get(), how, input, &output);
  } else {  // of no use to the next call
    pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_pkey(nullptr, rsa_key.pkey(), nullptr));
    must(context && prepare(context.get()), "preparing a key");
    res = run(context.get(), how, input, &output);
  }
  if (res == TEE_SUCCESS) *result = std::move(output);
  return res;
}

TEE_Result crypt_raw(key& rsa_key, const encryption& how, std::span<const uint8_t> input,
                     secret_bytes* result) {
  secret_bytes block;
  if (!pad_raw(rsa_key, input, &block)) return TEE_ERROR_BAD_PARAMETERS;
  if (TEE_Result res = crypt(rsa_key, how, block, result)) return res;
  strip_raw(result);
  return TEE_SUCCESS;
}

}  // namespace

size_t modulus_length(const key& rsa_key) {
  return (size_t{rsa_key.bits()} + 7) / 8;
}

TEE_Result rsa_encrypt(key& rsa_key, const algorithm& row, const oaep_options& oaep,
                       std::span<const uint8_t> input, secret_bytes* result) {
  const encryption how{row, TEE_MODE_ENCRYPT, oaep};
  if (row.padding == rsa_padding::NONE) return crypt_raw(rsa_key, how, input, result);
  if (input.size() > longest_message(rsa_key, row)) return TEE_ERROR_BAD_PARAMETERS;
  return crypt(rsa_key, how, input, result);
}

TEE_Result rsa_decrypt(key& rsa_key, const algorithm& row, const oaep_options& oaep,
                       std::span<const uint8_t> input, secret_bytes* result) {
  const encryption how{row, TEE_MODE_DECRYPT, oaep};
  if (row.padding == rsa_padding::NONE) return crypt_raw(rsa_key, how, input, result);
  if (input.size() != modulus_length(rsa_key)) return TEE_ERROR_BAD_PARAMETERS;
  return crypt(rsa_key, how, input, result);
}

TEE_Result rsa_sign(key& rsa_key, const algorithm& row, pss_salt salt,
                    std::span<const uint8_t> digest, uint8_t* signature) {
  pkey_context context(rsa_key, row.id, TEE_MODE_SIGN, [&](EVP_PKEY_CTX* fresh) {
    return prepare_signature(fresh, row, TEE_MODE_SIGN);
  });
  size_t written = modulus_length(rsa_key);
  bool done = set_salt(context.get(), row, TEE_MODE_SIGN, salt) &&
              EVP_PKEY_sign(context.get(), signature, &written, digest.data(), digest.size()) == 1;
  if (!done) forget_errors();
  return done ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}

bool rsa_verify(key& rsa_key, const algorithm& row, pss_salt salt, std::span<const uint8_t> digest,
                std::span<const uint8_t> signature) {
  // libcrypto takes a shorter PSS signature for the same number.
  if (signature.size() != modulus_length(rsa_key)) return false;
  pkey_context context(rsa_key, row.id, TEE_MODE_VERIFY, [&](EVP_PKEY_CTX* fresh) {
    return prepare_signature(fresh, row, TEE_MODE_VERIFY);
  });
  bool good = set_salt(context.get(), row, TEE_MODE_VERIFY, salt) &&
              EVP_PKEY_verify(context.get(), signature.data(), signature.size(), digest.data(),
                              digest.size()) == 1;
  if (!good) forget_errors();
  return good;
}

secret_bytes export_public_key(const key& any_key) {
  unsigned char* der = nullptr;
  int length = i2d_PUBKEY(any_key.pkey(), &der);
  must(length > 0, "i2d_PUBKEY");
  secret_bytes exported(der, der + length);
  OPENSSL_free(der);
  return exported;
}

}  // namespace tee::crypto
