// What the tests of authorisation share.
#pragma once

#include "support/sets.h"
#include "support/ta_under_test.h"

namespace keymaster::test {

constexpr uint64_t USER = 42;
constexpr uint64_t NOW = START_REE_MS;

// The key and the request that every case changes: an HMAC key that allows all it is asked for.
inline param_set verify_key(const param_set& more = {}) {
  return one(KM_TAG_ALGORITHM, KM_ALGORITHM_HMAC)
      .add(KM_TAG_KEY_SIZE, 256)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
      .add(KM_TAG_MIN_MAC_LENGTH, 128)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .append(more);
}

inline param_set sign_key(const param_set& more = {}) {
  return verify_key(one(KM_TAG_PURPOSE, SIGN).append(more));
}

inline param_set signer(keymaster_tag_t tag, uint64_t number) {
  return sign_key(one(tag, number));
}

inline param_set sign_request(const param_set& more = {}) {
  return mac_use(128).append(more);
}

inline param_set user_key(uint32_t auth_types) {
  return signer(KM_TAG_USER_SECURE_ID, USER).add(KM_TAG_USER_AUTH_TYPE, auth_types);
}

class auth : public testing::Test {
 protected:
  // A begin that ends with `error` (0: granted, and dropped again) and leaves these error lines,
  // behind which a refusal's last line is supplied unless it is there.
  void expect_begin(uint32_t purpose, byte_view blob, const param_set& request, int32_t error,
                    std::string lines) {
    const reply answer = ta.begin(purpose, blob, request);
    EXPECT_TRUE(refused(answer, error));
    if (error != 0 && lines.find("| begin") == std::string::npos) {
      lines += " | begin: Authorization failed";
    }
    EXPECT_EQ(ta.trace().errors(), lines);
    if (answer.ok()) ta.abort(answer.b);
  }
  void expect_sign(byte_view blob, int32_t error = 0, std::string lines = "",
                   const param_set& more = {}) {
    expect_begin(SIGN, blob, sign_request(more), error, std::move(lines));
  }

  ta_under_test ta;
};

}  // namespace keymaster::test
