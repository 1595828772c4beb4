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

// The attributes of a key pair. All its numbers are asked for at once, and the point as a whole:
// libcrypto computes the coordinates anew for every question about one of them.
std::vector<attribute> numbers_of(const EVP_PKEY* pkey, const curve& on) {
  secret_bytes point(1 + 2 * on.length());
  secret_bytes native(on.length());
  OSSL_PARAM params[] = {
      OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size()),
      OSSL_PARAM_construct_BN(OSSL_PKEY_PARAM_PRIV_KEY, native.data(), native.size()),
      OSSL_PARAM_construct_end()};
  must(EVP_PKEY_get_params(pkey, params) == 1 && params[0].return_size == point.size() &&
           params[1].return_size == native.size() && point.front() == UNCOMPRESSED_POINT,
       "EVP_PKEY_get_params");
  auto y = point.end() - static_cast<std::ptrdiff_t>(on.length());
  std::vector<attribute> attributes;
  attributes.push_back({TEE_ATTR_ECC_CURVE, {}, on.id, 0});
  attributes.push_back({TEE_ATTR_ECC_PUBLIC_VALUE_X, secret_bytes(point.begin() + 1, y)});
  attributes.push_back({TEE_ATTR_ECC_PUBLIC_VALUE_Y, secret_bytes(y, point.end())});
  attributes.push_back({TEE_ATTR_ECC_PRIVATE_VALUE, from_native(native)});
  return attributes;
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

TEE_Result generate_ec_key(uint32_t bits, std::span<const attribute_view> parameters,
                           key_ptr* result) {
  const attribute_view* named = find_attribute(parameters, TEE_ATTR_ECC_CURVE);
  const curve* on = named && parameters.size() == 1 ? find_curve(named->a) : nullptr;
  if (!on || on->bits != bits) return TEE_ERROR_BAD_PARAMETERS;
  pkey_ptr pkey(EVP_EC_gen(on->name));
  must(pkey != nullptr, "EVP_EC_gen");
  *result = std::make_shared<key>(TEE_TYPE_ECDSA_KEYPAIR, bits, numbers_of(pkey.get(), *on),
                                  std::move(pkey));
  return TEE_SUCCESS;
}

}  // namespace tee::crypto
