// Numbers and parameters in and out of libcrypto.
#include "tee/crypto/pkey.h"

#include <cstring>
#include <openssl/params.h>

namespace tee::crypto {

// libcrypto takes numbers in the machine's byte order.
void param_list::add_number(const char* name, std::span<const uint8_t> big_endian) {
  secret_bytes native(big_endian.rbegin(), big_endian.rend());
  if (native.empty()) native.push_back(0);
  values_.push_back(std::move(native));
  params_.push_back(OSSL_PARAM_construct_BN(name, values_.back().data(), values_.back().size()));
}

void param_list::add_bytes(const char* name, std::span<const uint8_t> bytes) {
  values_.emplace_back(bytes.begin(), bytes.end());
  params_.push_back(
      OSSL_PARAM_construct_octet_string(name, values_.back().data(), values_.back().size()));
}

void param_list::add_text(const char* name, const char* text) {
  values_.emplace_back(text, text + std::strlen(text) + 1);
  auto* copy = reinterpret_cast<char*>(values_.back().data());
  params_.push_back(OSSL_PARAM_construct_utf8_string(name, copy, 0));
}

OSSL_PARAM* param_list::end() {
  params_.push_back(OSSL_PARAM_construct_end());
  return params_.data();
}

pkey_ptr pkey_from(const char* algorithm, int selection, param_list params) {
  pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_name(nullptr, algorithm, nullptr));
  must(context && EVP_PKEY_fromdata_init(context.get()) == 1, "EVP_PKEY_fromdata_init");
  EVP_PKEY* made = nullptr;
  if (EVP_PKEY_fromdata(context.get(), &made, selection, params.end()) != 1) forget_errors();
  return pkey_ptr(made);
}

bignum_ptr to_bignum(std::span<const uint8_t> big_endian) {
  bignum_ptr number(BN_bin2bn(big_endian.data(), static_cast<int>(big_endian.size()), nullptr));
  must(number != nullptr, "BN_bin2bn");
  return number;
}

secret_bytes to_bytes(const BIGNUM* number, size_t length) {
  secret_bytes bytes(length);
  must(BN_bn2binpad(number, bytes.data(), static_cast<int>(length)) >= 0, "BN_bn2binpad");
  return bytes;
}

secret_bytes from_native(std::span<const uint8_t> native) {
  return {native.rbegin(), native.rend()};
}

bignum_ptr number_of(const EVP_PKEY* pkey, const char* name) {
  BIGNUM* number = nullptr;
  must(EVP_PKEY_get_bn_param(pkey, name, &number) == 1, name);
  return bignum_ptr(number);
}

}  // namespace tee::crypto
