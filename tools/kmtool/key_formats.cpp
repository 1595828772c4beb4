// Asymmetric keys in files: libcrypto reads and writes the public formats.
#include "key_formats.h"

#include <algorithm>
#include <cctype>
#include <openssl/core_names.h>
#include <openssl/ec.h>
#include <openssl/err.h>
#include <openssl/objects.h>
#include <openssl/param_build.h>
#include <openssl/pem.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "keymaster/tags.h"
#include "libcrypto.h"

namespace kmtool {

using namespace keymaster;

namespace {

struct curve {
  uint32_t bits;
  const char* group;
};
constexpr curve CURVES[] = {{224, "P-224"}, {256, "P-256"}, {384, "P-384"}, {521, "P-521"}};

// A key file must not ask for a passphrase: remembers that one was wanted, and gives none.
int no_passphrase(char*, size_t, size_t*, const OSSL_PARAM*, void* asked) {
  *static_cast<bool*>(asked) = true;
  return 0;
}

// Behind a key there may be the end of a line; a file can begin with text, but not end with some.
bool only_blanks(byte_view rest) {
  return std::ranges::all_of(rest, [](uint8_t byte) { return isspace(byte) != 0; });
}

owned<EVP_PKEY> decode(const char* type, const std::string& path, byte_view content) {
  EVP_PKEY* key = nullptr;
  bool encrypted = false;
  const owned<OSSL_DECODER_CTX> context(OSSL_DECODER_CTX_new_for_pkey(
      &key, nullptr, nullptr, type, EVP_PKEY_KEYPAIR, nullptr, nullptr));
  if (!context) throw std::bad_alloc();
  OSSL_DECODER_CTX_set_passphrase_cb(context.get(), no_passphrase, &encrypted);
  const unsigned char* at = content.data();
  size_t length = content.size();
  const int done = OSSL_DECODER_from_data(context.get(), &at, &length);
  ERR_clear_error();
  owned<EVP_PKEY> found(key);
  if (encrypted) {
    throw failure(WRONG_USAGE, path + " is encrypted",
                  "Decrypt it first, for instance with 'openssl pkey -in FILE -out FILE'.");
  }
  if (done != 1 || !found) {
    throw failure(WRONG_USAGE, path + " holds no " + type + " private key",
                  "It takes PEM or DER: PKCS #8, PKCS #1 (RSA) or SEC 1 (EC).");
  }
  if (!only_blanks({at, length})) {
    throw failure(WRONG_USAGE,
                  path + " holds more than one key: " + std::to_string(length) + " bytes follow it",
                  "It takes one private key.");
  }
  return found;
}

// What libcrypto's decoder lets pass: numbers that do not belong together, a private value out of
// range, a point that is not the private value's or not on the curve.
void require_sound(EVP_PKEY* key, const std::string& path) {
  const owned<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new(key, nullptr));
  if (!context) throw std::bad_alloc();
  const int sound = EVP_PKEY_check(context.get());
  ERR_clear_error();
  if (sound != 1) {
    throw failure(WRONG_USAGE, path + " holds a key whose numbers do not belong together");
  }
}

owned<BIGNUM> number_of(const EVP_PKEY* key, const char* name, const std::string& path) {
  BIGNUM* number = nullptr;
  if (EVP_PKEY_get_bn_param(key, name, &number) != 1) {
    ERR_clear_error();
    throw failure(WRONG_USAGE, path + " lacks a part of the key: " + name,
                  "Keys of more than two primes, or without their primes, are not taken.");
  }
  return owned<BIGNUM>(number);
}

void append_number(const BIGNUM* number, size_t size, client::field_writer* writer) {
  bytes content(size);
  BN_bn2binpad(number, content.data(), static_cast<int>(size));
  writer->field(content);
  OPENSSL_cleanse(content.data(), content.size());
}

bool has_third_prime(const EVP_PKEY* key) {
  BIGNUM* prime = nullptr;
  const bool found = EVP_PKEY_get_bn_param(key, OSSL_PKEY_PARAM_RSA_FACTOR3, &prime) == 1;
  BN_clear_free(prime);
  ERR_clear_error();
  return found;
}

bytes raw_rsa(const EVP_PKEY* key, const std::string& path) {
  if (has_third_prime(key)) {
    throw failure(WRONG_USAGE, path + " holds an RSA key of more than two primes",
                  "Keys of two primes are taken.");
  }
  client::field_writer writer;
  for (const char* name :
       {OSSL_PKEY_PARAM_RSA_N, OSSL_PKEY_PARAM_RSA_E, OSSL_PKEY_PARAM_RSA_D,
        OSSL_PKEY_PARAM_RSA_FACTOR1, OSSL_PKEY_PARAM_RSA_FACTOR2, OSSL_PKEY_PARAM_RSA_EXPONENT1,
        OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1}) {
    const owned<BIGNUM> number = number_of(key, name, path);
    append_number(number.get(), static_cast<size_t>(BN_num_bytes(number.get())), &writer);
  }
  return writer.take();
}

const curve* curve_of(const EVP_PKEY* key, const std::string& path) {
  char name[80] = "parameters of its own";
  EVP_PKEY_get_group_name(key, name, sizeof(name), nullptr);
  ERR_clear_error();
  for (const curve& row : CURVES) {
    if (EC_curve_nist2nid(row.group) == OBJ_sn2nid(name)) return &row;
  }
  throw failure(WRONG_USAGE, path + " holds a key on the curve " + name,
                "Keys on P-224, P-256, P-384 and P-521 are taken.");
}

bytes raw_ec(const EVP_PKEY* key, const std::string& path) {
  const uint32_t bits = curve_of(key, path)->bits;
  const size_t size = (bits + 7) / 8;
  client::field_writer writer;
  writer.u32(bits);
  for (const char* name :
       {OSSL_PKEY_PARAM_EC_PUB_X, OSSL_PKEY_PARAM_EC_PUB_Y, OSSL_PKEY_PARAM_PRIV_KEY}) {
    append_number(number_of(key, name, path).get(), size, &writer);
  }
  return writer.take();
}

// Right-aligned in `size` bytes.
void put(byte_view number, size_t size, bytes* to) {
  while (!number.empty() && number[0] == 0)
    number = number.subspan(1);
  if (number.size() > size) throw client::format_error("a coordinate is longer than its curve");
  to->insert(to->end(), size - number.size(), 0);
  client::append(to, number);
}

owned<EVP_PKEY> ec_key(byte_view exported) {
  client::field_reader reader(exported);
  const uint32_t bits = reader.u32();
  const curve* found = nullptr;
  for (const curve& row : CURVES) {
    if (row.bits == bits) found = &row;
  }
  if (found == nullptr) throw client::format_error("a curve of " + std::to_string(bits) + " bits");
  const size_t size = (bits + 7) / 8;
  bytes point = {POINT_CONVERSION_UNCOMPRESSED};
  put(reader.field(), size, &point);
  put(reader.field(), size, &point);
  OSSL_PARAM parameters[] = {
      OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME, const_cast<char*>(found->group),
                                       0),
      OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size()),
      OSSL_PARAM_construct_end()};
  const owned<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_name(nullptr, "EC", nullptr));
  EVP_PKEY* key = nullptr;
  if (!context || EVP_PKEY_fromdata_init(context.get()) != 1 ||
      EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_PUBLIC_KEY, parameters) != 1) {
    ERR_clear_error();
    throw client::format_error("a point that is not on its curve");
  }
  return owned<EVP_PKEY>(key);
}

}  // namespace

bytes raw_key_data(uint32_t algorithm, const std::string& path, byte_view content) {
  switch (algorithm) {
    case KM_ALGORITHM_RSA:
    case KM_ALGORITHM_EC: {
      const bool rsa = algorithm == KM_ALGORITHM_RSA;
      const owned<EVP_PKEY> key = decode(rsa ? "RSA" : "EC", path, content);
      bytes raw = rsa ? raw_rsa(key.get(), path) : raw_ec(key.get(), path);
      require_sound(key.get(), path);
      return raw;
    }
    default:
      return client::copy_of(content);
  }
}

bytes new_rsa_key_data(uint32_t bits) {
  const owned<EVP_PKEY> key(EVP_RSA_gen(bits));
  if (!key) throw std::runtime_error("libcrypto cannot make an RSA key");
  return raw_rsa(key.get(), "the new key");
}

bytes public_key_der(uint32_t algorithm, byte_view exported) {
  if (algorithm != KM_ALGORITHM_EC) return client::copy_of(exported);
  const owned<EVP_PKEY> key = ec_key(exported);
  unsigned char* der = nullptr;
  const int length = i2d_PUBKEY(key.get(), &der);
  if (length < 0) throw std::bad_alloc();
  bytes result(der, der + length);
  OPENSSL_free(der);
  return result;
}

std::string public_key_pem(byte_view der) {
  const owned<BIO> bio(BIO_new(BIO_s_mem()));
  if (!bio || PEM_write_bio(bio.get(), PEM_STRING_PUBLIC, "", der.data(),
                            static_cast<long>(der.size())) <= 0) {
    throw std::bad_alloc();
  }
  char* text = nullptr;
  const long length = BIO_get_mem_data(bio.get(), &text);
  return std::string(text, static_cast<size_t>(length));
}

}  // namespace kmtool
