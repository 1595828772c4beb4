#include "ta/pkey.h"

#include <openssl/err.h>
#include <openssl/x509.h>
#include <stdexcept>
#include <string>

namespace keymaster::test {
namespace {

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(std::string(what) + " failed in libcrypto");
}

struct deleter {
  void operator()(EVP_PKEY_CTX* p) const { EVP_PKEY_CTX_free(p); }
};
using owned_context = std::unique_ptr<EVP_PKEY_CTX, deleter>;

constexpr const char* RSA_NUMBERS[] = {
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,           OSSL_PKEY_PARAM_RSA_D,
    OSSL_PKEY_PARAM_RSA_FACTOR1,   OSSL_PKEY_PARAM_RSA_FACTOR2,     OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
constexpr const char* EC_NUMBERS[] = {OSSL_PKEY_PARAM_EC_PUB_X, OSSL_PKEY_PARAM_EC_PUB_Y,
                                      OSSL_PKEY_PARAM_PRIV_KEY};

const char* curve_name(uint32_t bits) {
  if (bits == 521) return "secp521r1";
  if (bits == 384) return "secp384r1";
  return bits == 256 ? "prime256v1" : "secp224r1";
}

const EVP_MD* digest_of(uint32_t digest) {
  constexpr const char* NAMES[] = {nullptr, "MD5", "SHA1", "SHA224", "SHA256", "SHA384", "SHA512"};
  return digest == KM_DIGEST_NONE ? nullptr : EVP_get_digestbyname(NAMES[digest]);
}

void set_padding(EVP_PKEY_CTX* context, scheme how, int salt) {
  int padding = RSA_PKCS1_PADDING;
  if (how.padding == 0) return;
  if (how.padding == KM_PAD_NONE) padding = RSA_NO_PADDING;
  if (how.padding == KM_PAD_RSA_OAEP) padding = RSA_PKCS1_OAEP_PADDING;
  if (how.padding == KM_PAD_RSA_PSS) padding = RSA_PKCS1_PSS_PADDING;
  must(EVP_PKEY_CTX_set_rsa_padding(context, padding) == 1, "set_rsa_padding");
  if (how.padding == KM_PAD_RSA_PSS) {
    must(EVP_PKEY_CTX_set_rsa_pss_saltlen(context, salt) == 1, "set_rsa_pss_saltlen");
  }
  if (how.padding == KM_PAD_RSA_OAEP) {
    must(EVP_PKEY_CTX_set_rsa_oaep_md(context, digest_of(how.digest)) == 1, "set_rsa_oaep_md");
  }
}

using init_call = int (*)(EVP_PKEY_CTX*);

owned_context prepared(EVP_PKEY* key, init_call init, scheme how, int salt) {
  owned_context made(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  must(init(made.get()) == 1, "init");
  set_padding(made.get(), how, salt);
  const bool signs = init == EVP_PKEY_sign_init || init == EVP_PKEY_verify_init;
  if (signs && how.digest != KM_DIGEST_NONE) {
    must(EVP_PKEY_CTX_set_signature_md(made.get(), digest_of(how.digest)) == 1, "signature_md");
  }
  return made;
}

bytes hashed(uint32_t digest, byte_view message) {
  if (digest == KM_DIGEST_NONE) return {message.begin(), message.end()};
  bytes result(EVP_MAX_MD_SIZE);
  unsigned length = 0;
  EVP_Digest(message.data(), message.size(), result.data(), &length, digest_of(digest), nullptr);
  result.resize(length);
  return result;
}

using run_call = int (*)(EVP_PKEY_CTX*, unsigned char*, size_t*, const unsigned char*, size_t);

bytes run(run_call call, EVP_PKEY_CTX* context, byte_view input) {
  bytes output(1024);
  size_t length = output.size();
  must(call(context, output.data(), &length, input.data(), input.size()) == 1, "operation");
  output.resize(length);
  return output;
}

}  // namespace

pkey::pkey(EVP_PKEY* key) : key_(key) {
  must(key != nullptr, "making a key");
}

pkey pkey::rsa(uint32_t bits) {
  return pkey(EVP_RSA_gen(bits));
}

pkey pkey::ec(uint32_t bits) {
  return pkey(EVP_EC_gen(curve_name(bits)));
}

pkey pkey::rsa_public(byte_view spki) {
  const unsigned char* cursor = spki.data();
  pkey key(d2i_PUBKEY(nullptr, &cursor, static_cast<long>(spki.size())));
  must(cursor == spki.data() + spki.size(), "d2i_PUBKEY to the end");
  return key;
}

pkey pkey::ec_public(byte_view raw) {
  client::field_reader in(raw);
  const uint32_t bits = in.u32();
  bytes point{4};
  for (int i = 0; i < 2; i++) {
    const byte_view coordinate = in.field();
    must(coordinate.size() == (bits + 7) / 8, "a coordinate of full length");
    point.insert(point.end(), coordinate.begin(), coordinate.end());
  }
  must(in.left() == 0, "the end of the record");
  OSSL_PARAM parts[] = {
      OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME,
                                       const_cast<char*>(curve_name(bits)), 0),
      OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size()),
      OSSL_PARAM_construct_end()};
  const owned_context maker(EVP_PKEY_CTX_new_from_name(nullptr, "EC", nullptr));
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_fromdata_init(maker.get()) == 1 &&
           EVP_PKEY_fromdata(maker.get(), &key, EVP_PKEY_PUBLIC_KEY, parts) == 1,
       "EVP_PKEY_fromdata");
  return pkey(key);
}

bytes pkey::import_data() const {
  client::field_writer out;
  if (EVP_PKEY_is_a(key_.get(), "RSA")) {
    for (const char* name : RSA_NUMBERS)
      out.field(number(name));
    return out.take();
  }
  out.u32(bits());
  for (const char* name : EC_NUMBERS)
    out.field(right_aligned(number(name), (bits() + 7) / 8));
  return out.take();
}

bytes pkey::number(const char* name) const {
  BIGNUM* found = nullptr;
  must(EVP_PKEY_get_bn_param(key_.get(), name, &found) == 1, name);
  bytes result(static_cast<size_t>(BN_num_bytes(found)));
  BN_bn2bin(found, result.data());
  BN_clear_free(found);
  return result;
}

bytes pkey::sign(scheme how, byte_view message, int salt) const {
  const auto made = prepared(key_.get(), EVP_PKEY_sign_init, how, salt);
  return run(EVP_PKEY_sign, made.get(), hashed(how.digest, message));
}

bool pkey::verify(scheme how, byte_view message, byte_view signature, int salt) const {
  const auto made = prepared(key_.get(), EVP_PKEY_verify_init, how, salt);
  const bytes digest = hashed(how.digest, message);
  const int outcome =
      EVP_PKEY_verify(made.get(), signature.data(), signature.size(), digest.data(), digest.size());
  ERR_clear_error();
  return outcome == 1;
}

bytes pkey::encrypt(scheme how, byte_view message) const {
  return run(EVP_PKEY_encrypt, prepared(key_.get(), EVP_PKEY_encrypt_init, how, 0).get(), message);
}

bytes pkey::decrypt(scheme how, byte_view message) const {
  return run(EVP_PKEY_decrypt, prepared(key_.get(), EVP_PKEY_decrypt_init, how, 0).get(), message);
}

bytes right_aligned(bytes data, size_t size) {
  data.insert(data.begin(), size - data.size(), 0);
  return data;
}

}  // namespace keymaster::test
