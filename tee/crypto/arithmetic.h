// Arithmetic on unsigned numbers of any length.
#pragma once

#include <cstdint>
#include <span>

#include "tee/crypto/openssl.h"

namespace tee::crypto {

// big_number: an unsigned number, wiped when it goes.
class big_number {
 public:
  // The number in big-endian bytes; none are 0.
  explicit big_number(std::span<const uint8_t> big_endian);

  size_t bits() const;
  // Fills `big_endian`, which has room for it, with leading zeros.
  void write(std::span<uint8_t> big_endian) const;
  // -1, 0 or 1 as this is below, the same as or above `other`.
  int compare(const big_number& other) const;

  // (a + b) mod n, (a b) mod n, a mod n. `n` is above 0.
  static big_number add_modulo(const big_number& a, const big_number& b, const big_number& n);
  static big_number multiply_modulo(const big_number& a, const big_number& b, const big_number& n);
  static big_number reduce(const big_number& a, const big_number& n);

  // Whether it is a prime, but for a chance of 2^-128.
  bool is_prime() const;

 private:
  big_number();

  bignum_ptr value_;
};

}  // namespace tee::crypto
