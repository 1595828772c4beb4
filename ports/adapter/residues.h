// Arithmetic modulo one number, on the platform's arithmetical API.
#pragma once

#include "tee_internal_api.h"

#include "ta/base/heap.h"

namespace keymaster::adapter {

// longest_modulus: the bits of the largest numbers that the platform's API takes.
[[nodiscard]] size_t longest_modulus();

// residues: numbers below a modulus. Each result is a fresh number that lives as long as the
// residues do; no more than MAX_NUMBERS of them. Whether all went well is asked once, by status().
class residues {
 public:
  static constexpr size_t MAX_NUMBERS = 10;
  using number = TEE_BigInt*;

  // `modulus`: at least two bytes without leading zeros, and at most longest_modulus() bits.
  // TEE_ERROR_OUT_OF_MEMORY.
  [[nodiscard]] TEE_Result begin(byte_view modulus);

  // The residue of a number of any length.
  number load(byte_view value);
  number add(number a, number b);
  number multiply(number a, number b);

  [[nodiscard]] static bool is_one(number a);
  [[nodiscard]] static bool equal(number a, number b);
  // TEE_SUCCESS; else results mean nothing: TEE_ERROR_OVERFLOW for too many numbers, or what the
  // platform said of a conversion.
  [[nodiscard]] TEE_Result status() const { return status_; }

 private:
  number take();
  void convert(number to, byte_view value);

  heap_buffer words_;
  size_t words_each_ = 0;
  size_t taken_ = 0;
  size_t chunk_size_ = 0;  // bytes of the longest string that is surely below the modulus
  number modulus_{};
  number shift_{};  // 256 to the chunk's size
  TEE_Result status_ = TEE_SUCCESS;
};

// is_prime: whether `candidate` is a prime but for a chance of 2^-80. Its length as a modulus'.
[[nodiscard]] TEE_Result is_prime(byte_view candidate, bool* prime);

}  // namespace keymaster::adapter
