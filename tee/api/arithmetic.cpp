// TEE Internal Core API: arithmetic. The words of a TEE_BigInt: how many follow the first two, the
// sign (0 or 1 for below zero), then the magnitude, least word first.
#include "tee/crypto/arithmetic.h"

#include "tee_internal_api.h"

#include "tee/api/arguments.h"
#include "tee/core/faults.h"
#include "tee/core/instance.h"

using tee::guarded;
using tee::panic;
using tee::secret_bytes;
using tee::crypto::big_number;

namespace {

constexpr size_t HEAD_WORDS = 2;
constexpr size_t WORD_SIZE = sizeof(TEE_BigInt);

std::span<const TEE_BigInt> words_of(const char* call, const TEE_BigInt* number) {
  if (!number || number[0] == 0) panic(call, "a big integer is null or not initialised");
  return {number + HEAD_WORDS, number[0]};
}

bool is_negative(const TEE_BigInt* number) {
  return number[1] != 0;
}

big_number read(const char* call, const TEE_BigInt* number) {
  auto words = words_of(call, number);
  secret_bytes bytes(words.size() * WORD_SIZE);
  for (size_t i = 0; i < bytes.size(); ++i) {
    bytes[bytes.size() - 1 - i] = static_cast<uint8_t>(words[i / WORD_SIZE] >> 8 * (i % WORD_SIZE));
  }
  return big_number(bytes);
}

// Modular arithmetic is defined here for numbers from 0 up, which is what its callers have.
big_number read_operand(const char* call, const TEE_BigInt* number) {
  big_number value = read(call, number);
  if (is_negative(number)) panic(call, "an operand is below zero");
  return value;
}

big_number read_modulus(const char* call, const TEE_BigInt* number) {
  big_number value = read_operand(call, number);
  if (value.bits() < 2) panic(call, "the modulus is below 2");
  return value;
}

// False when the number does not fit.
bool write(const char* call, const big_number& value, bool negative, TEE_BigInt* number) {
  size_t count = words_of(call, number).size();
  if (value.bits() > count * WORD_SIZE * 8) return false;
  secret_bytes bytes(count * WORD_SIZE);
  value.write(bytes);
  number[1] = negative ? 1 : 0;
  for (size_t i = 0; i < count; ++i)
    number[HEAD_WORDS + i] = 0;
  for (size_t i = 0; i < bytes.size(); ++i) {
    number[HEAD_WORDS + i / WORD_SIZE] |= TEE_BigInt{bytes[bytes.size() - 1 - i]}
                                          << 8 * (i % WORD_SIZE);
  }
  return true;
}

void write_result(const char* call, const big_number& value, TEE_BigInt* dest) {
  if (!write(call, value, false, dest)) panic(call, "the result does not fit");
}

int32_t signed_order(int order, bool a_negative, bool b_negative) {
  if (a_negative != b_negative) return a_negative ? -1 : 1;
  return a_negative ? -order : order;
}

}  // namespace

void TEE_BigIntInit(TEE_BigInt* bigInt, size_t len) {
  constexpr const char* CALL = "TEE_BigIntInit";
  guarded(CALL, [&] {
    tee::current_instance(CALL);
    if (!bigInt || len <= HEAD_WORDS) panic(CALL, "no room for a big integer");
    std::fill_n(bigInt, len, 0);
    bigInt[0] = static_cast<uint32_t>(len - HEAD_WORDS);
  });
}

TEE_Result TEE_BigIntConvertFromOctetString(TEE_BigInt* dest, const uint8_t* buffer,
                                            size_t bufferLen, int32_t sign) {
  constexpr const char* CALL = "TEE_BigIntConvertFromOctetString";
  return guarded(CALL, [&]() -> TEE_Result {
    tee::current_instance(CALL);
    big_number value(tee::input_bytes(CALL, "buffer", buffer, bufferLen));
    if (TEE_Result fault = tee::fault_point()) return fault;
    const bool negative = sign < 0 && value.bits() > 0;
    return write(CALL, value, negative, dest) ? TEE_SUCCESS : TEE_ERROR_OVERFLOW;
  });
}

int32_t TEE_BigIntCmp(const TEE_BigInt* op1, const TEE_BigInt* op2) {
  constexpr const char* CALL = "TEE_BigIntCmp";
  return guarded(CALL, [&] {
    const int order = read(CALL, op1).compare(read(CALL, op2));
    return signed_order(order, is_negative(op1), is_negative(op2));
  });
}

int32_t TEE_BigIntCmpS32(const TEE_BigInt* op, int32_t shortVal) {
  constexpr const char* CALL = "TEE_BigIntCmpS32";
  return guarded(CALL, [&] {
    const bool negative = shortVal < 0;
    auto magnitude = static_cast<uint32_t>(shortVal);
    if (negative) magnitude = 0 - magnitude;
    const uint8_t bytes[] = {static_cast<uint8_t>(magnitude >> 24),
                             static_cast<uint8_t>(magnitude >> 16),
                             static_cast<uint8_t>(magnitude >> 8), static_cast<uint8_t>(magnitude)};
    return signed_order(read(CALL, op).compare(big_number(bytes)), is_negative(op), negative);
  });
}

void TEE_BigIntMod(TEE_BigInt* dest, const TEE_BigInt* op, const TEE_BigInt* n) {
  constexpr const char* CALL = "TEE_BigIntMod";
  guarded(CALL, [&] {
    const big_number modulus = read_modulus(CALL, n);
    write_result(CALL, big_number::reduce(read_operand(CALL, op), modulus), dest);
  });
}

void TEE_BigIntAddMod(TEE_BigInt* dest, const TEE_BigInt* op1, const TEE_BigInt* op2,
                      const TEE_BigInt* n) {
  constexpr const char* CALL = "TEE_BigIntAddMod";
  guarded(CALL, [&] {
    const big_number modulus = read_modulus(CALL, n);
    write_result(CALL,
                 big_number::add_modulo(read_operand(CALL, op1), read_operand(CALL, op2), modulus),
                 dest);
  });
}

void TEE_BigIntMulMod(TEE_BigInt* dest, const TEE_BigInt* op1, const TEE_BigInt* op2,
                      const TEE_BigInt* n) {
  constexpr const char* CALL = "TEE_BigIntMulMod";
  guarded(CALL, [&] {
    const big_number modulus = read_modulus(CALL, n);
    const big_number a = read_operand(CALL, op1);
    write_result(CALL, big_number::multiply_modulo(a, read_operand(CALL, op2), modulus), dest);
  });
}

int32_t TEE_BigIntIsProbablePrime(const TEE_BigInt* op, uint32_t) {
  constexpr const char* CALL = "TEE_BigIntIsProbablePrime";
  // 0: composite. -1: a prime but for a chance that is below every confidence that can be asked.
  return guarded(CALL, [&] { return read_operand(CALL, op).is_prime() ? -1 : 0; });
}
