// Arithmetic on unsigned numbers.
#include "tee/crypto/arithmetic.h"

namespace tee::crypto {
namespace {

bn_ctx_ptr scratch() {
  bn_ctx_ptr made(BN_CTX_secure_new());
  must(made != nullptr, "BN_CTX_secure_new");
  return made;
}

}  // namespace

big_number::big_number() : value_(BN_new()) {
  must(value_ != nullptr, "BN_new");
}

big_number::big_number(std::span<const uint8_t> big_endian)
    : value_(BN_bin2bn(big_endian.data(), static_cast<int>(big_endian.size()), nullptr)) {
  must(value_ != nullptr, "BN_bin2bn");
}

size_t big_number::bits() const {
  return static_cast<size_t>(BN_num_bits(value_.get()));
}

void big_number::write(std::span<uint8_t> big_endian) const {
  const int size = static_cast<int>(big_endian.size());
  must(BN_bn2binpad(value_.get(), big_endian.data(), size) == size, "BN_bn2binpad");
}

int big_number::compare(const big_number& other) const {
  return BN_cmp(value_.get(), other.value_.get());
}

big_number big_number::add_modulo(const big_number& a, const big_number& b, const big_number& n) {
  big_number sum;
  must(BN_mod_add(sum.value_.get(), a.value_.get(), b.value_.get(), n.value_.get(),
                  scratch().get()) == 1,
       "BN_mod_add");
  return sum;
}

big_number big_number::multiply_modulo(const big_number& a, const big_number& b,
                                       const big_number& n) {
  big_number product;
  must(BN_mod_mul(product.value_.get(), a.value_.get(), b.value_.get(), n.value_.get(),
                  scratch().get()) == 1,
       "BN_mod_mul");
  return product;
}

big_number big_number::reduce(const big_number& a, const big_number& n) {
  big_number rest;
  must(BN_nnmod(rest.value_.get(), a.value_.get(), n.value_.get(), scratch().get()) == 1,
       "BN_nnmod");
  return rest;
}

bool big_number::is_prime() const {
  const int answer = BN_check_prime(value_.get(), scratch().get(), nullptr);
  must(answer >= 0, "BN_check_prime");
  return answer == 1;
}

}  // namespace tee::crypto
