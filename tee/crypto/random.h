// Random bytes for keys and nonces.
#pragma once

#include <cstdint>
#include <span>

namespace tee::crypto {

// fill_random: fills all of `bytes` from libcrypto's private generator (NIST SP 800-90A), or throws
// crypto_failure: nobody may go on with bytes that are not random.
void fill_random(std::span<uint8_t> bytes);

}  // namespace tee::crypto
