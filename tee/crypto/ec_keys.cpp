// Keys on the NIST prime curves.
#include "tee/crypto/ec_keys.h"

#include <openssl/core_names.h>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/pkey.h"

namespace tee::crypto {
namespace {

constexpr uint8_t UNCOMPRESSED_POINT = 0x04;  // SEC 1, 2.3.3

// Brings a number to the field's length; false when it is longer.
bool pad(secret_bytes* number, size_t length) {
  auto significant = without_leading_zeros(*number);
  if (significant.size() > length) return false;
  secret_bytes padded(length - significant.size());
  padded.insert(padded.end(), significant.begin(), significant.end());
  *number = std::move(padded);
  return true;
}

secret_bytes encode_point(const attribute& x, const attribute& y) {
  secret_bytes point{UNCOMPRESSED_POINT};
  point.insert(point.end(), x.bytes.begin(), x.bytes.end());
  point.insert(point.end(), y.bytes.begin(), y.bytes.end());
  return point;
}

bool private_half_matches(EVP_PKEY* pkey) {
  pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_pkey(nullptr, pkey, nullptr));
  must(context != nullptr, "EVP_PKEY_CTX_new_from_pkey");
  bool matches =
      EVP_PKEY_private_check(context.get()) == 1 && EVP_PKEY_pairwise_check(context.get()) == 1;
  if (!matches) forget_errors();
  return matches;
}

}  // namespace

TEE_Result load_ec_key(uint32_t type, uint32_t max_bits, std::vector<attribute> attributes,
                       key_ptr* result) {
  const curve* on = find_curve(attributes.front().a);
  if (!on || on->bits > max_bits) return TEE_ERROR_BAD_PARAMETERS;
  attributes.front().b = 0;
  for (size_t i = 1; i < attributes.size(); ++i) {
    if (!pad(&attributes[i].bytes, on->length())) return TEE_ERROR_BAD_PARAMETERS;
  }
  param_list params;
  params.add_text(OSSL_PKEY_PARAM_GROUP_NAME, on->name);
  params.add_bytes(OSSL_PKEY_PARAM_PUB_KEY, encode_point(attributes[1], attributes[2]));
  bool pair = type == TEE_TYPE_ECDSA_KEYPAIR;
  if (pair) params.add_number(OSSL_PKEY_PARAM_PRIV_KEY, attributes[3].bytes);
  pkey_ptr pkey = pkey_from("EC", pair ? EVP_PKEY_KEYPAIR : EVP_PKEY_PUBLIC_KEY, std::move(params));
  if (!pkey || (pair && !private_half_matches(pkey.get()))) return TEE_ERROR_BAD_PARAMETERS;
  *result = std::make_shared<key>(type, on->bits, std::move(attributes), std::move(pkey));
  return TEE_SUCCESS;
}

TEE_Result generate_ec_key(uint32_t bits, std::span<const attribute> parameters, key_ptr* result) {
  const attribute* named = find_attribute(parameters, TEE_ATTR_ECC_CURVE);
  const curve* on = named && parameters.size() == 1 ? find_curve(named->a) : nullptr;
  if (!on || on->bits != bits) return TEE_ERROR_BAD_PARAMETERS;
  pkey_ptr pkey(EVP_EC_gen(on->name));
  must(pkey != nullptr, "EVP_EC_gen");
  auto number = [&](uint32_t id, const char* param) {
    return attribute{id, to_bytes(number_of(pkey.get(), param).get(), on->length())};
  };
  std::vector<attribute> attributes;
  attributes.push_back({TEE_ATTR_ECC_CURVE, {}, on->id, 0});
  attributes.push_back(number(TEE_ATTR_ECC_PUBLIC_VALUE_X, OSSL_PKEY_PARAM_EC_PUB_X));
  attributes.push_back(number(TEE_ATTR_ECC_PUBLIC_VALUE_Y, OSSL_PKEY_PARAM_EC_PUB_Y));
  attributes.push_back(number(TEE_ATTR_ECC_PRIVATE_VALUE, OSSL_PKEY_PARAM_PRIV_KEY));
  *result =
      std::make_shared<key>(TEE_TYPE_ECDSA_KEYPAIR, bits, std::move(attributes), std::move(pkey));
  return TEE_SUCCESS;
}

}  // namespace tee::crypto
