// Arithmetic modulo one number.
#include "ports/adapter/residues.h"

#include <algorithm>

#include "ports/adapter/platform_calls.h"

namespace keymaster::adapter {
namespace {

// Beside the numbers handed out: modulus, shift, and what load works in.
constexpr size_t OWN_NUMBERS = 5;
constexpr size_t ALL_NUMBERS = residues::MAX_NUMBERS + OWN_NUMBERS;

constexpr uint32_t CONFIDENCE = 80;  // bits; the least that the API takes

}  // namespace

size_t longest_modulus() {
  uint32_t bits = 0;
  const TEE_Result res =
      TEE_GetPropertyAsU32(TEE_PROPSET_TEE_IMPLEMENTATION, "gpd.tee.arith.maxBigIntSize", &bits);
  return res == TEE_SUCCESS ? bits : 0;
}

TEE_Result residues::begin(byte_view modulus) {
  words_each_ = TEE_BigIntSizeInU32(modulus.size() * 8);
  taken_ = 0;
  chunk_size_ = modulus.size() - 1;
  if (!words_.allocate(ALL_NUMBERS * words_each_ * sizeof(TEE_BigInt)))
    return TEE_ERROR_OUT_OF_MEMORY;
  modulus_ = take();
  convert(modulus_, modulus);
  if (status_ != TEE_SUCCESS) return status_;
  shift_ = take();
  heap_buffer power;  // of 256, which has one byte more than the chunk
  if (!power.allocate(modulus.size())) return TEE_ERROR_OUT_OF_MEMORY;
  power.span().front() = 1;
  const number unreduced = take();
  convert(unreduced, power.view());
  TEE_BigIntMod(shift_, unreduced, modulus_);
  return status_;
}

residues::number residues::take() {
  if (taken_ == ALL_NUMBERS) {
    status_ = TEE_ERROR_OVERFLOW;
    taken_--;
  }
  auto* words = reinterpret_cast<TEE_BigInt*>(words_.data()) + taken_++ * words_each_;
  TEE_BigIntInit(words, static_cast<tee_size>(words_each_));
  return words;
}

void residues::convert(number to, byte_view value) {
  const TEE_Result res = TEE_BigIntConvertFromOctetString(
      to, value.data(), static_cast<tee_size>(value.size()), /*sign=*/1);
  if (res != TEE_SUCCESS) status_ = res;
}

residues::number residues::load(byte_view value) {
  // Chunk by chunk from the front, so that nothing is ever longer than the modulus.
  const number sum = take();
  const size_t mark = taken_;
  const number next = take();
  const number chunk = take();
  while (!value.empty()) {
    const size_t size = value.size() % chunk_size_ == 0 ? chunk_size_ : value.size() % chunk_size_;
    convert(chunk, value.first(size));
    value = value.subspan(size);
    TEE_BigIntMulMod(next, sum, shift_, modulus_);
    TEE_BigIntAddMod(sum, next, chunk, modulus_);
  }
  taken_ = mark;
  return sum;
}

residues::number residues::add(number a, number b) {
  const number sum = take();
  TEE_BigIntAddMod(sum, a, b, modulus_);
  return sum;
}

residues::number residues::multiply(number a, number b) {
  const number product = take();
  TEE_BigIntMulMod(product, a, b, modulus_);
  return product;
}

bool residues::is_one(number a) {
  return TEE_BigIntCmpS32(a, 1) == 0;
}

bool residues::equal(number a, number b) {
  return TEE_BigIntCmp(a, b) == 0;
}

TEE_Result is_prime(byte_view candidate, bool* prime) {
  const size_t words = TEE_BigIntSizeInU32(candidate.size() * 8);
  heap_buffer number;
  if (!number.allocate(words * sizeof(TEE_BigInt))) return TEE_ERROR_OUT_OF_MEMORY;
  auto* big = reinterpret_cast<TEE_BigInt*>(number.data());
  TEE_BigIntInit(big, static_cast<tee_size>(words));
  if (TEE_Result res = TEE_BigIntConvertFromOctetString(
          big, candidate.data(), static_cast<tee_size>(candidate.size()), /*sign=*/1)) {
    return res;
  }
  *prime = TEE_BigIntIsProbablePrime(big, CONFIDENCE) != 0;
  return TEE_SUCCESS;
}

}  // namespace keymaster::adapter
