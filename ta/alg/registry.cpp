// The registry of algorithms, and the small answers that their tables share.
#include "ta/alg/aes/aes.h"
#include "ta/alg/algorithm.h"
#include "ta/alg/ec/ec.h"
#include "ta/alg/hmac/hmac.h"
#include "ta/alg/rsa/rsa.h"

namespace keymaster {
namespace {

const algorithm_t* const REGISTRY[] = {&RSA_ALGORITHM, &AES_ALGORITHM, &EC_ALGORITHM,
                                       &HMAC_ALGORITHM};

bool requested_value(const keymaster_key_param_set_t& params, keymaster_tag_t tag,
                     uint32_t* value) {
  const keymaster_key_param_t* param = get_unique(params, tag);
  if (param == nullptr) return false;
  *value = param->enumerated;
  return true;
}

}  // namespace

const algorithm_t* find_algorithm(uint32_t algorithm) {
  for (const algorithm_t* descriptor : REGISTRY) {
    if (descriptor->algorithm == algorithm) return descriptor;
  }
  return nullptr;
}

bool takes_none(const keymaster_key_param_set_t&, uint32_t*) {
  return false;
}

bool requested_digest(const keymaster_key_param_set_t& params, uint32_t* value) {
  return requested_value(params, KM_TAG_DIGEST, value);
}

bool requested_padding(const keymaster_key_param_set_t& params, uint32_t* value) {
  return requested_value(params, KM_TAG_PADDING, value);
}

outcome refuse_export(byte_view, byte_span, size_t* produced) {
  *produced = 0;
  return KM_ERROR_UNSUPPORTED_KEY_FORMAT;
}

}  // namespace keymaster
