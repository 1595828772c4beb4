// What the tests of RSA share.
#pragma once

#include "ta/pkey.h"

namespace keymaster::test {

constexpr scheme RAW = {KM_PAD_NONE, KM_DIGEST_NONE};
constexpr scheme PKCS1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_NONE};
constexpr scheme PKCS1_SHA1 = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_DIGEST_SHA1};
constexpr scheme PKCS1_ENCRYPT = {KM_PAD_RSA_PKCS1_1_5_ENCRYPT, KM_DIGEST_NONE};
constexpr scheme OAEP_SHA256 = {KM_PAD_RSA_OAEP, KM_DIGEST_SHA_2_256};

inline const param_set ANY_USE = any_use(KM_ALGORITHM_RSA);

// text: a message of that many bytes, which do not repeat soon.
inline bytes text(size_t length) {
  bytes result(length);
  for (size_t i = 0; i < length; i++)
    result[i] = static_cast<uint8_t>(i * 7 + 1);
  return result;
}

class rsa_device : public testing::Test {
 protected:
  reply verify(byte_view blob, scheme how, byte_view message, byte_view signature) {
    return ta.try_run(VERIFY, blob, use(how), message, signature);
  }

  ta_under_test ta;
};

}  // namespace keymaster::test
