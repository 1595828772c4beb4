// Algorithms as libcrypto knows them, fetched once for the process: an implicit fetch at every use
// costs as much as a short digest.
#pragma once

#include <cstddef>
#include <openssl/evp.h>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/openssl.h"

namespace tee::crypto {

// digest_of: the implementation of a digest other than NONE.
const EVP_MD* digest_of(hash which);

// cipher_of: AES in a mode other than NONE with keys of 128, 192 or 256 bits.
const EVP_CIPHER* cipher_of(block_mode mode, uint32_t key_bits);

// new_hmac: a context for HMAC (RFC 2104) with the digest, to which only the key is to be given.
mac_ctx_ptr new_hmac(hash which);

// length_of: the length of a digest, in bytes; 0 for NONE.
size_t length_of(hash which);

}  // namespace tee::crypto
