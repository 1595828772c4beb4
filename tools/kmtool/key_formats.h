// Asymmetric keys between the forms of other tools and the TA's raw forms.
#pragma once

#include "keymaster/client/bytes.h"
#include "tool.h"

namespace kmtool {

using keymaster::client::byte_view;
using keymaster::client::bytes;

// raw_key_data: what import_key takes, from the content of a key file.
//   RSA, EC: a private key in PEM or DER; PKCS #8, PKCS #1 (RSA) or SEC 1 (EC). RSA gives eight
//   numbers n, e, d, p, q, dp, dq, qinv, each a u32 little-endian length and big-endian bytes; EC
//   gives u32 key size in bits, then X, Y and the private value in the same form.
//   HMAC, AES: the content itself.
// Throws failure (WRONG_USAGE) for a file that is no such key, is encrypted, or is another's.
bytes raw_key_data(uint32_t algorithm, const std::string& path, byte_view content);

// new_rsa_key_data: a fresh RSA key pair of `bits` with exponent 65537, in the same raw form.
bytes new_rsa_key_data(uint32_t bits);

// public_key_der: the DER SubjectPublicKeyInfo (RFC 5280) of what export_key gave: RSA keys come in
// that form, EC keys as u32 key size, X and Y.
bytes public_key_der(uint32_t algorithm, byte_view exported);

// public_key_pem: the same in PEM.
std::string public_key_pem(byte_view der);

}  // namespace kmtool
