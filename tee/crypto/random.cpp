// Random bytes.
#include "tee/crypto/random.h"

#include <openssl/rand.h>

#include "tee/crypto/openssl.h"

namespace tee::crypto {

void fill_random(std::span<uint8_t> bytes) {
  must(RAND_priv_bytes_ex(nullptr, bytes.data(), bytes.size(), 0) == 1, "RAND_priv_bytes_ex");
}

}  // namespace tee::crypto
