// EMSA-PSS.
#include "ports/adapter/pss.h"

#include <algorithm>
#include <bit>

#include "ports/adapter/hasher.h"

namespace keymaster::adapter {
namespace {

constexpr uint8_t TRAILER = 0xBC;
constexpr uint8_t SEPARATOR = 0x01;
constexpr uint8_t PADDING_1[8] = {};
// Takes the mask of RFC 8017, B.2.1, that grows from `seed` off `bytes`.
TEE_Result unmask(uint32_t digest, byte_view seed, byte_span bytes) {
  hasher hash;
  if (TEE_Result res = hash.begin(digest)) return res;
  for (uint32_t counter = 0; !bytes.empty(); counter++) {
    uint8_t number[sizeof(counter)];
    for (size_t i = 0; i < sizeof(number); i++) {
      number[i] = static_cast<uint8_t>(counter >> (8 * (sizeof(number) - 1 - i)));
    }
    hash.update(seed);
    hash.update(number);
    digest_bytes mask;
    if (TEE_Result res = hash.finish(&mask)) return res;
    const size_t size = std::min(bytes.size(), pss_digest_size(digest));
    for (size_t i = 0; i < size; i++)
      bytes[i] ^= mask[i];
    bytes = bytes.subspan(size);
  }
  return TEE_SUCCESS;
}

// The bits of the block's first byte that the modulus leaves to it.
uint8_t first_byte_mask(byte_view modulus) {
  const int width = std::bit_width(modulus.front());
  return static_cast<uint8_t>(width <= 1 ? 0xFF : 0xFF >> (9 - width));
}

// The salt behind the zeros and the separator of an unmasked data block; false without those.
bool find_salt(byte_view data_block, byte_view* salt) {
  const auto separator = std::ranges::find_if(data_block, [](uint8_t byte) { return byte != 0; });
  if (separator == data_block.end() || *separator != SEPARATOR) return false;
  *salt = data_block.subspan(static_cast<size_t>(separator - data_block.begin()) + 1);
  return true;
}

// H' of RFC 8017, 9.1.2.
TEE_Result hash_salted(uint32_t digest, byte_view hash, byte_view salt, digest_bytes* result) {
  hasher salted;
  if (TEE_Result res = salted.begin(digest)) return res;
  salted.update(PADDING_1);
  salted.update(hash);
  salted.update(salt);
  return salted.finish(result);
}

}  // namespace

size_t pss_digest_size(uint32_t digest) {
  switch (digest) {
    case TEE_ALG_SHA1:
      return 20;
    case TEE_ALG_SHA224:
      return 28;
    case TEE_ALG_SHA256:
      return 32;
    case TEE_ALG_SHA384:
      return 48;
    default:
      return MAX_DIGEST_SIZE;
  }
}

size_t pss_encoded_size(byte_view modulus) {
  return modulus.size() - (!modulus.empty() && modulus.front() == 1 ? 1 : 0);
}

size_t pss_longest_salt(byte_view modulus, size_t digest_size) {
  const size_t size = pss_encoded_size(modulus);
  return size > digest_size + 2 ? size - digest_size - 2 : 0;
}

TEE_Result pss_verify(uint32_t digest, byte_view modulus, byte_view hash, byte_span block) {
  const size_t size = pss_encoded_size(modulus);
  const byte_view ahead = block.first(block.size() - size);
  const byte_span encoded = block.last(size);
  const size_t digest_size = pss_digest_size(digest);
  const uint8_t mask = first_byte_mask(modulus);
  if (size < digest_size + 2 || encoded.back() != TRAILER || (encoded.front() & ~mask) != 0 ||
      std::ranges::any_of(ahead, [](uint8_t byte) { return byte != 0; })) {
    return TEE_ERROR_SIGNATURE_INVALID;
  }
  const byte_span data_block = encoded.first(size - digest_size - 1);
  const byte_view signed_hash = encoded.subspan(data_block.size(), digest_size);
  if (TEE_Result res = unmask(digest, signed_hash, data_block)) return res;
  data_block.front() &= mask;
  byte_view salt;
  if (!find_salt(data_block, &salt)) return TEE_ERROR_SIGNATURE_INVALID;
  digest_bytes expected;
  if (TEE_Result res = hash_salted(digest, hash, salt, &expected)) return res;
  const bool good = equal_constant_time(signed_hash, byte_view(expected).first(digest_size));
  return good ? TEE_SUCCESS : TEE_ERROR_SIGNATURE_INVALID;
}

}  // namespace keymaster::adapter
