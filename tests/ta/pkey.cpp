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

const EVP_MD* digest_of(uint32_t digest) {
  constexpr const char* NAMES[] = {nullptr, "MD5", "SHA1", "SHA224", "SHA256", "SHA384", "SHA512"};
  return digest == KM_DIGEST_NONE ? nullptr : EVP_get_digestbyname(NAMES[digest]);
}

// By KM_PAD_*.
constexpr int PADDINGS[] = {0,
                            RSA_NO_PADDING,
                            RSA_PKCS1_OAEP_PADDING,
                            RSA_PKCS1_PSS_PADDING,
                            RSA_PKCS1_PADDING,
                            RSA_PKCS1_PADDING};

using init_call = int (*)(EVP_PKEY_CTX*);

owned_context prepared(EVP_PKEY* key, init_call init, scheme how, int salt = 0) {
  owned_context made(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  must(init(made.get()) == 1, "init");
  if (how.padding != 0) {
    must(EVP_PKEY_CTX_set_rsa_padding(made.get(), PADDINGS[how.padding]) == 1, "set_rsa_padding");
  }
  if (how.padding == KM_PAD_RSA_PSS) {
    must(EVP_PKEY_CTX_set_rsa_pss_saltlen(made.get(), salt) == 1, "set_rsa_pss_saltlen");
  }
  const auto set_digest =
      how.padding == KM_PAD_RSA_OAEP ? EVP_PKEY_CTX_set_rsa_oaep_md : EVP_PKEY_CTX_set_signature_md;
  must(how.digest == KM_DIGEST_NONE || set_digest(made.get(), digest_of(how.digest)) == 1,
       "set_md");
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
  return pkey(EVP_EC_gen(("P-" + std::to_string(bits)).c_str()));
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
    client::append(&point, coordinate);
  }
  must(in.left() == 0, "the end of the record");
  pkey key = ec(bits);
  must(EVP_PKEY_set1_encoded_public_key(key.key_.get(), point.data(), point.size()) == 1, "point");
  return key;
}

bytes pkey::import_data(const std::map<size_t, bytes>& replaced) const {
  const bool is_rsa = EVP_PKEY_is_a(key_.get(), "RSA") == 1;
  client::field_writer out;
  if (!is_rsa) out.u32(bits());
  for (size_t i = 0; i < (is_rsa ? std::size(RSA_NUMBERS) : std::size(EC_NUMBERS)); i++) {
    if (replaced.contains(i)) {
      out.field(replaced.at(i));
    } else {
      out.field(is_rsa ? number(RSA_NUMBERS[i])
                       : right_aligned(number(EC_NUMBERS[i]), (bits() + 7) / 8));
    }
  }
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
  return run(EVP_PKEY_encrypt, prepared(key_.get(), EVP_PKEY_encrypt_init, how).get(), message);
}

bytes pkey::decrypt(scheme how, byte_view message) const {
  return run(EVP_PKEY_decrypt, prepared(key_.get(), EVP_PKEY_decrypt_init, how).get(), message);
}

bytes right_aligned(bytes data, size_t size) {
  data.insert(data.begin(), size - data.size(), 0);
  return data;
}

}  // namespace keymaster::test
