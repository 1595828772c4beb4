// The numbers of RSA key pairs (RFC 8017, 3.2).
#include <algorithm>

#include "ports/adapter/key_numbers.h"
#include "ports/adapter/residues.h"
#include "ta/alg/big_endian.h"

namespace keymaster::adapter {
namespace {

struct rsa_numbers_t {
  byte_view modulus, public_exponent, private_exponent;
  byte_view prime1, prime2, exponent1, exponent2, coefficient;
};

bool is_odd(byte_view number) {
  return !number.empty() && (number.back() & 1) != 0;
}

// Whether a b = product. Column by column from the least byte; no sum of a column overflows, since
// primes are shorter than 2^16 bytes. The time depends on the lengths alone.
bool is_product(byte_view a, byte_view b, byte_view product) {
  uint8_t difference = 0;
  uint32_t carry = 0;
  for (size_t column = 0; column < a.size() + b.size(); column++) {
    const size_t first = column < b.size() ? 0 : column - b.size() + 1;
    const size_t last = std::min(column + 1, a.size());
    uint32_t sum = carry & 0xFF;
    carry >>= 8;
    for (size_t i = first; i < last; i++) {
      sum += uint32_t{a[a.size() - 1 - i]} * b[b.size() - 1 - (column - i)];
    }
    const bool within = column < product.size();
    const uint8_t wanted = within ? product[product.size() - 1 - column] : uint8_t{0};
    difference |= static_cast<uint8_t>(sum ^ wanted);
    carry += sum >> 8;
  }
  return difference == 0 && carry == 0 && product.size() <= a.size() + b.size();
}

// Lengths for which the arithmetic below is defined.
bool is_bounded(const rsa_numbers_t& key) {
  const size_t longest = std::min(longest_modulus() / 8, size_t{UINT16_MAX});
  for (byte_view prime : {key.prime1, key.prime2}) {
    if (!is_odd(prime) || prime.size() < 2 || prime.size() > longest) return false;
  }
  return is_below(key.private_exponent, key.modulus) &&
         is_below(key.public_exponent, key.modulus) && is_below(key.exponent1, key.prime1) &&
         is_below(key.exponent2, key.prime2) && is_below(key.coefficient, key.prime1);
}

TEE_Result verdict(const residues& field, bool good) {
  if (field.status() != TEE_SUCCESS) return field.status();
  return good ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}

// e d = 1 and e `exponent` = 1 modulo `prime` - 1.
TEE_Result check_exponents(const rsa_numbers_t& key, byte_view prime, byte_view exponent) {
  heap_buffer order;
  if (!order.copy_of(prime)) return TEE_ERROR_OUT_OF_MEMORY;
  order.span().back() &= 0xFE;  // the prime is odd
  residues field;
  if (TEE_Result res = field.begin(order.view())) return res;
  const auto e = field.load(key.public_exponent);
  const bool whole = residues::is_one(field.multiply(e, field.load(key.private_exponent)));
  const bool part = residues::is_one(field.multiply(e, field.load(exponent)));
  return verdict(field, whole && part && is_below(exponent, order.view()));
}

TEE_Result check_coefficient(const rsa_numbers_t& key) {
  residues field;
  if (TEE_Result res = field.begin(key.prime1)) return res;
  const auto product = field.multiply(field.load(key.prime2), field.load(key.coefficient));
  return verdict(field, residues::is_one(product));
}

// A product of more primes than two would pass all else and give wrong results.
TEE_Result check_prime(byte_view candidate) {
  bool prime = false;
  if (TEE_Result res = is_prime(candidate, &prime)) return res;
  return prime ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}

TEE_Result check_primes(const rsa_numbers_t& key) {
  if (!is_bounded(key) || !is_product(key.prime1, key.prime2, key.modulus)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (TEE_Result res = check_exponents(key, key.prime1, key.exponent1)) return res;
  if (TEE_Result res = check_exponents(key, key.prime2, key.exponent2)) return res;
  if (TEE_Result res = check_coefficient(key)) return res;
  if (TEE_Result res = check_prime(key.prime1)) return res;
  return check_prime(key.prime2);
}

}  // namespace

TEE_Result check_rsa_numbers(std::span<const TEE_Attribute> attributes) {
  if (!has_attribute(attributes, TEE_ATTR_RSA_PRIME1)) return TEE_SUCCESS;
  const auto number = [&](uint32_t id) { return find_number(attributes, id); };
  return check_primes({number(TEE_ATTR_RSA_MODULUS), number(TEE_ATTR_RSA_PUBLIC_EXPONENT),
                       number(TEE_ATTR_RSA_PRIVATE_EXPONENT), number(TEE_ATTR_RSA_PRIME1),
                       number(TEE_ATTR_RSA_PRIME2), number(TEE_ATTR_RSA_EXPONENT1),
                       number(TEE_ATTR_RSA_EXPONENT2), number(TEE_ATTR_RSA_COEFFICIENT)});
}

byte_view find_number(std::span<const TEE_Attribute> attributes, uint32_t id) {
  const auto found = std::ranges::find(attributes, id, &TEE_Attribute::attributeID);
  if (found == attributes.end()) return {};
  const auto& content = found->content.ref;
  return without_leading_zeros({static_cast<const uint8_t*>(content.buffer), content.length});
}

bool has_attribute(std::span<const TEE_Attribute> attributes, uint32_t id) {
  return std::ranges::find(attributes, id, &TEE_Attribute::attributeID) != attributes.end();
}

bool is_below(byte_view a, byte_view b) {
  if (a.size() != b.size()) return a.size() < b.size();
  return std::ranges::lexicographical_compare(a, b);
}

}  // namespace keymaster::adapter
