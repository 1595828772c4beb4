// What libcrypto says when it fails.
#include "tee/crypto/openssl.h"

#include <openssl/err.h>
#include <string>

namespace tee::crypto {
namespace {

std::string describe(const char* what) {
  const char* reason = ERR_reason_error_string(ERR_peek_last_error());
  ERR_clear_error();
  return std::string(what) + " failed: " + (reason ? reason : "no reason given");
}

}  // namespace

crypto_failure::crypto_failure(const char* what) : std::runtime_error(describe(what)) {}

void forget_errors() {
  ERR_clear_error();
}

}  // namespace tee::crypto
