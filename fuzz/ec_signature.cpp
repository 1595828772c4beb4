// Any bytes as a DER signature for numbers of some length, and any two numbers as a signature. What
// is accepted encodes back to the same bytes, what is made is accepted and gives the numbers back,
// and the heap is empty afterwards.
#include "ta/alg/ec/ec_signature.h"

#include <algorithm>
#include <cstdlib>
#include <vector>

#include "platform.h"

using namespace keymaster;

namespace {

constexpr size_t LONGEST = 72;  // of a number; some more than the largest curve's

void require(bool holds) {
  if (!holds) std::abort();
}

void take_apart(byte_view der, size_t length) {
  std::vector<uint8_t> r(length);
  std::vector<uint8_t> s(length);
  if (der_decode_ec_signature(der, r, s) != TEE_SUCCESS) return;
  heap_buffer encoded;
  require(der_encode_ec_signature(r, s, &encoded) == TEE_SUCCESS);
  require(std::ranges::equal(encoded.view(), der));
}

void put_together(byte_view r, byte_view s) {
  heap_buffer encoded;
  if (der_encode_ec_signature(r, s, &encoded) != TEE_SUCCESS) return;  // as at 127 bytes
  std::vector<uint8_t> same_r(r.size());
  std::vector<uint8_t> same_s(s.size());
  require(der_decode_ec_signature(encoded.view(), same_r, same_s) == TEE_SUCCESS);
  require(std::ranges::equal(r, same_r) && std::ranges::equal(s, same_s));
}

}  // namespace

// The first byte is the length of the numbers.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  platform::reset();
  const byte_view rest(data + 1, size - 1);
  take_apart(rest, 1 + data[0] % LONGEST);
  const byte_view numbers = rest.first(std::min(rest.size(), 2 * LONGEST));
  put_together(numbers.first(numbers.size() / 2), numbers.subspan(numbers.size() / 2));
  require(platform::live_blocks == 0 && platform::unwiped_blocks == 0);
  return 0;
}
