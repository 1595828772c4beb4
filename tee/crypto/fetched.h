// Algorithms as libcrypto knows them, fetched once for the process: an implicit fetch at every use
// costs as much as a short digest.
#pragma once

#include <cstddef>
#include <openssl/evp.h>

#include "tee/crypto/algorithms.h"

namespace tee::crypto {

// digest_of: the implementation of a digest other than NONE.
const EVP_MD* digest_of(hash which);

// cipher_of: AES in a mode other than NONE with keys of 128, 192 or 256 bits.
const EVP_CIPHER* cipher_of(block_mode mode, uint32_t key_bits);

// hmac_algorithm: HMAC (RFC 2104), of any digest.
EVP_MAC* hmac_algorithm();

// name_of, length_of: libcrypto's name of a digest; its result's length in bytes. 0 for NONE.
const char* name_of(hash which);
size_t length_of(hash which);

}  // namespace tee::crypto
