#include "ta/pkey.h"

#include <openssl/core_names.h>
#include <openssl/err.h>
#include <openssl/param_build.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>
#include <stdexcept>
#include <string>

namespace keymaster::test {
namespace {

using client::from_hex;

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(std::string(what) + " failed in libcrypto");
}

struct deleter {
  void operator()(BIGNUM* p) const { BN_free(p); }
  void operator()(BN_CTX* p) const { BN_CTX_free(p); }
  void operator()(EVP_PKEY_CTX* p) const { EVP_PKEY_CTX_free(p); }
  void operator()(OSSL_PARAM_BLD* p) const { OSSL_PARAM_BLD_free(p); }
  void operator()(OSSL_PARAM* p) const { OSSL_PARAM_free(p); }
};
template <typename T>
using owner = std::unique_ptr<T, deleter>;

owner<BIGNUM> number_of(byte_view big_endian) {
  return owner<BIGNUM>(BN_bin2bn(big_endian.data(), static_cast<int>(big_endian.size()), nullptr));
}

constexpr const char* RSA_NUMBERS[] = {
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,           OSSL_PKEY_PARAM_RSA_D,
    OSSL_PKEY_PARAM_RSA_FACTOR1,   OSSL_PKEY_PARAM_RSA_FACTOR2,     OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};

const char* curve_name(uint32_t bits) {
  if (bits == 521) return "secp521r1";
  if (bits == 384) return "secp384r1";
  return bits == 256 ? "prime256v1" : "secp224r1";
}

EVP_PKEY* build(const char* type, OSSL_PARAM_BLD* parts) {
  const owner<OSSL_PARAM> params(OSSL_PARAM_BLD_to_param(parts));
  const owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_fromdata_init(context.get()) == 1 &&
           EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_KEYPAIR, params.get()) == 1,
       "EVP_PKEY_fromdata");
  return key;
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

owner<EVP_PKEY_CTX> prepared(EVP_PKEY* key, init_call init, scheme how, int salt) {
  owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  must(init(context.get()) == 1, "init");
  set_padding(context.get(), how, salt);
  const bool signs = init == EVP_PKEY_sign_init || init == EVP_PKEY_verify_init;
  if (signs && how.digest != KM_DIGEST_NONE) {
    must(EVP_PKEY_CTX_set_signature_md(context.get(), digest_of(how.digest)) == 1, "signature_md");
  }
  return context;
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

pkey pkey::rsa(const char* p, const char* q) {
  const owner<BN_CTX> scratch(BN_CTX_new());
  const auto made = [] { return owner<BIGNUM>(BN_new()); };
  owner<BIGNUM> numbers[] = {made(),
                             number_of(from_hex("010001")),
                             made(),
                             number_of(from_hex(p)),
                             number_of(from_hex(q)),
                             made(),
                             made(),
                             made()};
  auto& [n, e, d, p_, q_, dp, dq, qi] = numbers;
  const owner<BIGNUM> p1(BN_dup(p_.get()));
  const owner<BIGNUM> q1(BN_dup(q_.get()));
  const owner<BIGNUM> order = made();
  must(BN_sub_word(p1.get(), 1) && BN_sub_word(q1.get(), 1) &&
           BN_mul(n.get(), p_.get(), q_.get(), scratch.get()) &&
           BN_mul(order.get(), p1.get(), q1.get(), scratch.get()) &&
           BN_mod_inverse(d.get(), e.get(), order.get(), scratch.get()) != nullptr &&
           BN_mod(dp.get(), d.get(), p1.get(), scratch.get()) &&
           BN_mod(dq.get(), d.get(), q1.get(), scratch.get()) &&
           BN_mod_inverse(qi.get(), q_.get(), p_.get(), scratch.get()) != nullptr,
       "RSA numbers");
  const owner<OSSL_PARAM_BLD> parts(OSSL_PARAM_BLD_new());
  for (size_t i = 0; i < std::size(RSA_NUMBERS); i++)
    OSSL_PARAM_BLD_push_BN(parts.get(), RSA_NUMBERS[i], numbers[i].get());
  return pkey(build("RSA", parts.get()));
}

pkey pkey::rsa_public(byte_view spki) {
  const unsigned char* cursor = spki.data();
  pkey key(d2i_PUBKEY(nullptr, &cursor, static_cast<long>(spki.size())));
  must(cursor == spki.data() + spki.size(), "d2i_PUBKEY to the end");
  return key;
}

pkey pkey::ec(byte_view raw) {
  client::field_reader in(raw);
  const uint32_t bits = in.u32();
  bytes point{4};
  for (int i = 0; i < 2; i++) {
    const byte_view coordinate = in.field();
    must(coordinate.size() == (bits + 7) / 8, "a coordinate of full length");
    point.insert(point.end(), coordinate.begin(), coordinate.end());
  }
  owner<BIGNUM> secret;
  if (in.left() != 0) secret = number_of(in.field());
  const owner<OSSL_PARAM_BLD> parts(OSSL_PARAM_BLD_new());
  OSSL_PARAM_BLD_push_utf8_string(parts.get(), OSSL_PKEY_PARAM_GROUP_NAME, curve_name(bits), 0);
  OSSL_PARAM_BLD_push_octet_string(parts.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(),
                                   point.size());
  if (secret) OSSL_PARAM_BLD_push_BN(parts.get(), OSSL_PKEY_PARAM_PRIV_KEY, secret.get());
  return pkey(build("EC", parts.get()));
}

bytes pkey::import_data() const {
  client::field_writer out;
  for (const char* name : RSA_NUMBERS)
    out.field(number(name));
  return out.take();
}

bytes pkey::number(const char* name) const {
  BIGNUM* found = nullptr;
  must(EVP_PKEY_get_bn_param(key_.get(), name, &found) == 1, name);
  const owner<BIGNUM> number(found);
  bytes result(static_cast<size_t>(BN_num_bytes(found)));
  BN_bn2bin(found, result.data());
  return result;
}

bytes pkey::sign(scheme how, byte_view message, int salt) const {
  const auto context = prepared(key_.get(), EVP_PKEY_sign_init, how, salt);
  return run(EVP_PKEY_sign, context.get(), hashed(how.digest, message));
}

bool pkey::verify(scheme how, byte_view message, byte_view signature, int salt) const {
  const auto context = prepared(key_.get(), EVP_PKEY_verify_init, how, salt);
  const bytes digest = hashed(how.digest, message);
  const int outcome = EVP_PKEY_verify(context.get(), signature.data(), signature.size(),
                                      digest.data(), digest.size());
  ERR_clear_error();
  return outcome == 1;
}

bytes pkey::encrypt(scheme how, byte_view message) const {
  return run(EVP_PKEY_encrypt, prepared(key_.get(), EVP_PKEY_encrypt_init, how, 0).get(), message);
}

bytes pkey::decrypt(scheme how, byte_view message) const {
  return run(EVP_PKEY_decrypt, prepared(key_.get(), EVP_PKEY_decrypt_init, how, 0).get(), message);
}

void expect_faults_reported(const std::function<bool()>& use) {
  bool fired = true;
  for (uint64_t n = 1; fired; n++) {
    tee::host::fail_nth_call(n, TEEC_ERROR_OUT_OF_MEMORY);
    const bool done = use();
    fired = tee::host::fault_fired();
    tee::host::clear_fault();
    EXPECT_NE(done, fired) << "call " << n;
  }
}

bool live_through(ta_under_test* ta, const param_set& description, byte_view key_data,
                  uint32_t purpose, const param_set& params, byte_view input, byte_view last) {
  const reply made = ta->send(import_request(description, key_data));
  if (!made.ok()) return false;
  client::key_result key;
  client::parse_imported(made.output(), &key);
  const reply begun = ta->begin(purpose, key.blob, params);
  return begun.ok() && ta->update(begun.b, input).ok() && ta->finish(begun.b, last).ok() &&
         ta->send(key_request(command::EXPORT_KEY, key.blob)).ok();
}

}  // namespace keymaster::test
