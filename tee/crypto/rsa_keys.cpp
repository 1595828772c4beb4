// RSA keys.
#include "tee/crypto/rsa_keys.h"

#include <array>
#include <openssl/core_names.h>
#include <openssl/rsa.h>

#include "tee/crypto/pkey.h"

namespace tee::crypto {
namespace {

constexpr int MIN_BITS = 512;
constexpr int EXPONENT_BITS = 64;
// Above this size of the modulus libcrypto takes public exponents of 64 bits at most.
constexpr int LARGE_MODULUS_BITS = 3072;
constexpr size_t NUMBERS_WITHOUT_CRT = 3;
constexpr std::array<uint8_t, 3> DEFAULT_EXPONENT{1, 0, 1};  // 65537

struct number_name {
  uint32_t attribute;
  const char* param;
};
// In the order of the key type's table.
constexpr std::array<number_name, 8> NUMBERS{
    {{TEE_ATTR_RSA_MODULUS, OSSL_PKEY_PARAM_RSA_N},
     {TEE_ATTR_RSA_PUBLIC_EXPONENT, OSSL_PKEY_PARAM_RSA_E},
     {TEE_ATTR_RSA_PRIVATE_EXPONENT, OSSL_PKEY_PARAM_RSA_D},
     {TEE_ATTR_RSA_PRIME1, OSSL_PKEY_PARAM_RSA_FACTOR1},
     {TEE_ATTR_RSA_PRIME2, OSSL_PKEY_PARAM_RSA_FACTOR2},
     {TEE_ATTR_RSA_EXPONENT1, OSSL_PKEY_PARAM_RSA_EXPONENT1},
     {TEE_ATTR_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_EXPONENT2},
     {TEE_ATTR_RSA_COEFFICIENT, OSSL_PKEY_PARAM_RSA_COEFFICIENT1}}};

// The numbers of a key under test, in the order of NUMBERS.
class rsa_numbers {
 public:
  explicit rsa_numbers(std::span<const attribute> attributes) : scratch_(BN_CTX_secure_new()) {
    must(scratch_ != nullptr, "BN_CTX_secure_new");
    for (const attribute& number : attributes) {
      numbers_.push_back(to_bignum(number.bytes));
      BN_set_flags(numbers_.back().get(), BN_FLG_CONSTTIME);
    }
  }

  bool public_half_is_sound(uint32_t max_bits) const {
    int bits = BN_num_bits(n());
    if (bits < MIN_BITS || bits > static_cast<int>(max_bits) || !BN_is_odd(n())) return false;
    if (!BN_is_odd(e()) || BN_is_one(e()) || BN_cmp(e(), n()) >= 0) return false;
    return bits <= LARGE_MODULUS_BITS || BN_num_bits(e()) <= EXPONENT_BITS;
  }

  // Without the primes the exponents can only be tried out.
  bool exponents_match() const {
    if (BN_cmp(d(), n()) >= 0) return false;
    bignum_ptr two = to_bignum(std::array<uint8_t, 1>{2});
    bignum_ptr power(BN_new());
    must(power && BN_mod_exp(power.get(), two.get(), d(), n(), scratch_.get()) == 1 &&
             BN_mod_exp(power.get(), power.get(), e(), n(), scratch_.get()) == 1,
         "BN_mod_exp");
    return BN_cmp(power.get(), two.get()) == 0;
  }

  bool crt_numbers_match() const {
    const BIGNUM* p = number(3);
    const BIGNUM* q = number(4);
    if (BN_cmp(d(), n()) >= 0 || BN_cmp(p, n()) >= 0 || BN_cmp(q, n()) >= 0) return false;
    bignum_ptr product(BN_new());
    must(product && BN_mul(product.get(), p, q, scratch_.get()) == 1, "BN_mul");
    return BN_cmp(product.get(), n()) == 0 && inverse_below(number(5), p) &&
           inverse_below(number(6), q) && BN_cmp(number(7), p) < 0 &&
           product_is_one(number(7), q, p);
  }

 private:
  const BIGNUM* number(size_t index) const { return numbers_[index].get(); }
  const BIGNUM* n() const { return number(0); }
  const BIGNUM* e() const { return number(1); }
  const BIGNUM* d() const { return number(2); }

  // Whether `exponent` undoes e modulo the prime, as d must too.
  bool inverse_below(const BIGNUM* exponent, const BIGNUM* prime) const {
    bignum_ptr order(BN_dup(prime));
    must(order && BN_sub_word(order.get(), 1) == 1, "BN_sub_word");
    return BN_cmp(exponent, order.get()) < 0 && product_is_one(exponent, e(), order.get()) &&
           product_is_one(d(), e(), order.get());
  }

  bool product_is_one(const BIGNUM* a, const BIGNUM* b, const BIGNUM* modulus) const {
    bignum_ptr product(BN_new());
    must(product && BN_mod_mul(product.get(), a, b, modulus, scratch_.get()) == 1, "BN_mod_mul");
    return BN_is_one(product.get());
  }

  std::vector<bignum_ptr> numbers_;
  bn_ctx_ptr scratch_;
};

bool sound(std::span<const attribute> attributes, uint32_t max_bits) {
  // Nothing of a key is longer than its modulus; checked first, so that hostile lengths cost
  // nothing.
  for (const attribute& number : attributes) {
    if (number.bytes.size() > attributes.front().bytes.size()) return false;
  }
  if (attributes.front().bytes.size() > max_bits / 8 + 1) return false;
  rsa_numbers numbers(attributes);
  if (!numbers.public_half_is_sound(max_bits)) return false;
  switch (attributes.size()) {
    case 2:
      return true;
    case NUMBERS_WITHOUT_CRT:
      return numbers.exponents_match();
    case NUMBERS.size():
      return numbers.crt_numbers_match();
    default:
      return false;
  }
}

// Null when libcrypto gives up, as it may for an exponent of many small factors.
pkey_ptr generate_pkey(uint32_t bits, BIGNUM* exponent) {
  pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr));
  EVP_PKEY* made = nullptr;
  must(context && EVP_PKEY_keygen_init(context.get()) == 1 &&
           EVP_PKEY_CTX_set_rsa_keygen_bits(context.get(), static_cast<int>(bits)) == 1 &&
           EVP_PKEY_CTX_set1_rsa_keygen_pubexp(context.get(), exponent) == 1,
       "EVP_PKEY_keygen_init");
  if (EVP_PKEY_generate(context.get(), &made) != 1) forget_errors();
  return pkey_ptr(made);
}

}  // namespace

TEE_Result load_rsa_key(uint32_t type, uint32_t max_bits, std::vector<attribute> attributes,
                        key_ptr* result) {
  for (attribute& number : attributes) {
    auto significant = without_leading_zeros(number.bytes);
    number.bytes = secret_bytes(significant.begin(), significant.end());
  }
  if (!sound(attributes, max_bits)) return TEE_ERROR_BAD_PARAMETERS;
  param_list params;
  for (size_t i = 0; i < attributes.size(); ++i) {
    params.add_number(NUMBERS[i].param, attributes[i].bytes);
  }
  int selection = type == TEE_TYPE_RSA_KEYPAIR ? EVP_PKEY_KEYPAIR : EVP_PKEY_PUBLIC_KEY;
  pkey_ptr pkey = pkey_from("RSA", selection, std::move(params));
  if (!pkey) return TEE_ERROR_BAD_PARAMETERS;
  auto bits = static_cast<uint32_t>(EVP_PKEY_get_bits(pkey.get()));
  *result = std::make_shared<key>(type, bits, std::move(attributes), std::move(pkey));
  return TEE_SUCCESS;
}

TEE_Result generate_rsa_key(uint32_t bits, std::span<const attribute_view> parameters,
                            key_ptr* result) {
  const attribute_view* given = find_attribute(parameters, TEE_ATTR_RSA_PUBLIC_EXPONENT);
  if (parameters.size() != (given ? 1 : 0)) return TEE_ERROR_BAD_PARAMETERS;
  auto exponent = without_leading_zeros(given ? given->bytes : DEFAULT_EXPONENT);
  bool usable = !exponent.empty() && exponent.size() <= 8 && (exponent.back() & 1) != 0 &&
                (exponent.size() > 1 || exponent.back() != 1);
  if (!usable) return TEE_ERROR_BAD_PARAMETERS;
  bignum_ptr wanted = to_bignum(exponent);
  pkey_ptr pkey = generate_pkey(bits, wanted.get());
  if (!pkey) return TEE_ERROR_BAD_PARAMETERS;
  std::vector<attribute> attributes;
  attributes.reserve(NUMBERS.size());
  for (const number_name& name : NUMBERS) {
    attributes.push_back({name.attribute, to_bytes(number_of(pkey.get(), name.param).get())});
  }
  // libcrypto is known to fall back to its own exponent.
  must(BN_cmp(number_of(pkey.get(), OSSL_PKEY_PARAM_RSA_E).get(), wanted.get()) == 0 &&
           EVP_PKEY_get_bits(pkey.get()) == static_cast<int>(bits),
       "generating the RSA key that was asked for");
  *result =
      std::make_shared<key>(TEE_TYPE_RSA_KEYPAIR, bits, std::move(attributes), std::move(pkey));
  return TEE_SUCCESS;
}

}  // namespace tee::crypto
