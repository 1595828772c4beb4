// RSA and ECDSA in bare libcrypto.
#include "bench/bare_pkey.h"

#include <cstring>
#include <openssl/core_names.h>
#include <openssl/param_build.h>
#include <openssl/rsa.h>
#include <vector>

namespace keymaster::bench {
namespace {

using number_ptr = std::unique_ptr<BIGNUM, freed_by<BN_free>>;
using builder_ptr = std::unique_ptr<OSSL_PARAM_BLD, freed_by<OSSL_PARAM_BLD_free>>;
using params_ptr = std::unique_ptr<OSSL_PARAM, freed_by<OSSL_PARAM_free>>;

const EVP_MD* sha256() {
  static const md_ptr fetched(EVP_MD_fetch(nullptr, "SHA256", nullptr));
  return fetched.get();
}

uint32_t take_u32(view* rest) {
  uint32_t value = 0;
  memcpy(&value, rest->data(), sizeof(value));
  *rest = rest->subspan(sizeof(value));
  return value;
}

view take_field(view* rest) {
  const uint32_t length = take_u32(rest);
  const view field = rest->first(length);
  *rest = rest->subspan(length);
  return field;
}

pkey_ptr build(const char* type, OSSL_PARAM_BLD* parts) {
  const params_ptr params(OSSL_PARAM_BLD_to_param(parts));
  const pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_fromdata_init(context.get()) == 1 &&
           EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_KEYPAIR, params.get()) == 1,
       "EVP_PKEY_fromdata");
  return pkey_ptr(key);
}

void set_scheme(EVP_PKEY_CTX* context, scheme how, const EVP_MD* digest) {
  switch (how) {
    case scheme::PKCS1:
      must(EVP_PKEY_CTX_set_rsa_padding(context, RSA_PKCS1_PADDING) == 1 &&
               EVP_PKEY_CTX_set_signature_md(context, digest) == 1,
           "PKCS1");
      break;
    case scheme::PSS:
      must(EVP_PKEY_CTX_set_rsa_padding(context, RSA_PKCS1_PSS_PADDING) == 1 &&
               EVP_PKEY_CTX_set_signature_md(context, digest) == 1 &&
               EVP_PKEY_CTX_set_rsa_pss_saltlen(context, RSA_PSS_SALTLEN_DIGEST) == 1,
           "PSS");
      break;
    case scheme::OAEP:
      must(EVP_PKEY_CTX_set_rsa_padding(context, RSA_PKCS1_OAEP_PADDING) == 1 &&
               EVP_PKEY_CTX_set_rsa_oaep_md(context, digest) == 1,
           "OAEP");
      break;
    case scheme::ECDSA:
      break;
  }
}

int init(EVP_PKEY_CTX* context, way direction) {
  switch (direction) {
    case way::SIGN:
      return EVP_PKEY_sign_init(context);
    case way::VERIFY:
      return EVP_PKEY_verify_init(context);
    case way::ENCRYPT:
      return EVP_PKEY_encrypt_init(context);
    default:
      return EVP_PKEY_decrypt_init(context);
  }
}

}  // namespace

pkey_ptr rsa_pkey(view material) {
  constexpr const char* NAMES[] = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                                   OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                                   OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                                   OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  take_u32(&material);
  const builder_ptr parts(OSSL_PARAM_BLD_new());
  std::vector<number_ptr> numbers;  // the parts refer to them
  for (const char* name : NAMES) {
    const view field = take_field(&material);
    numbers.emplace_back(BN_bin2bn(field.data(), static_cast<int>(field.size()), nullptr));
    must(OSSL_PARAM_BLD_push_BN(parts.get(), name, numbers.back().get()) == 1, name);
  }
  return build("RSA", parts.get());
}

pkey_ptr ec_pkey(view material) {
  const uint32_t bits = take_u32(&material);
  const view x = take_field(&material);
  const view y = take_field(&material);
  const view d = take_field(&material);
  std::vector<uint8_t> point = {4};  // uncompressed
  point.insert(point.end(), x.begin(), x.end());
  point.insert(point.end(), y.begin(), y.end());
  const number_ptr secret(BN_bin2bn(d.data(), static_cast<int>(d.size()), nullptr));
  const builder_ptr parts(OSSL_PARAM_BLD_new());
  must(OSSL_PARAM_BLD_push_utf8_string(parts.get(), OSSL_PKEY_PARAM_GROUP_NAME,
                                       bits == 256 ? "P-256" : "P-521", 0) == 1 &&
           OSSL_PARAM_BLD_push_octet_string(parts.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(),
                                            point.size()) == 1 &&
           OSSL_PARAM_BLD_push_BN(parts.get(), OSSL_PKEY_PARAM_PRIV_KEY, secret.get()) == 1,
       "EC parts");
  return build("EC", parts.get());
}

bare_operation::bare_operation(EVP_PKEY* key, scheme how, way direction)
    : direction_(direction), context_(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr)) {
  must(init(context_.get(), direction) == 1, "init");
  set_scheme(context_.get(), how, sha256());
}

view bare_operation::hash(view message) {
  unsigned length = 0;
  must(EVP_Digest(message.data(), message.size(), digest_, &length, sha256(), nullptr) == 1,
       "EVP_Digest");
  return {digest_, length};
}

view bare_operation::run(view input) {
  size_t length = sizeof(output_);
  const view data = direction_ == way::SIGN ? hash(input) : input;
  const auto call = direction_ == way::SIGN      ? EVP_PKEY_sign
                    : direction_ == way::ENCRYPT ? EVP_PKEY_encrypt
                                                 : EVP_PKEY_decrypt;
  must(call(context_.get(), output_, &length, data.data(), data.size()) == 1, "EVP_PKEY call");
  return {output_, length};
}

void bare_operation::verify(view message, view signature) {
  const view digest = hash(message);
  must(EVP_PKEY_verify(context_.get(), signature.data(), signature.size(), digest.data(),
                       digest.size()) == 1,
       "EVP_PKEY_verify");
}

void take_apart(EVP_PKEY* key) {
  OSSL_PARAM* numbers = nullptr;
  must(EVP_PKEY_todata(key, EVP_PKEY_KEYPAIR, &numbers) == 1, "EVP_PKEY_todata");
  OSSL_PARAM_free(numbers);
}

bare_generator::bare_generator(const char* type)
    : context_(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr)) {
  must(EVP_PKEY_keygen_init(context_.get()) == 1, "EVP_PKEY_keygen_init");
}

bare_generator bare_generator::rsa(unsigned bits) {
  bare_generator made("RSA");
  must(EVP_PKEY_CTX_set_rsa_keygen_bits(made.context_.get(), static_cast<int>(bits)) == 1, "bits");
  return made;
}

bare_generator bare_generator::ec(const char* curve) {
  bare_generator made("EC");
  must(EVP_PKEY_CTX_set_group_name(made.context_.get(), curve) == 1, "curve");
  return made;
}

pkey_ptr bare_generator::run() {
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_generate(context_.get(), &key) == 1, "EVP_PKEY_generate");
  return pkey_ptr(key);
}

}  // namespace keymaster::bench
