// Keys of any type: their attributes, and the symmetric ones whole.
#include "tee/crypto/key.h"

#include <algorithm>

#include "tee/crypto/algorithms.h"
#include "tee/crypto/ec_keys.h"
#include "tee/crypto/random.h"
#include "tee/crypto/rsa_keys.h"

namespace tee::crypto {
namespace {

TEE_Result load_symmetric(const key_type& type, uint32_t max_bits,
                          std::vector<attribute> attributes, key_ptr* result) {
  size_t length = attributes.front().bytes.size();
  if (length > max_bits / 8) return TEE_ERROR_BAD_PARAMETERS;
  auto bits = static_cast<uint32_t>(length * 8);
  if (!type.allows(bits)) return TEE_ERROR_BAD_PARAMETERS;
  *result = std::make_shared<key>(type.id, bits, std::move(attributes), nullptr);
  return TEE_SUCCESS;
}

TEE_Result generate_symmetric(const key_type& type, uint32_t bits,
                              std::span<const attribute_view> parameters, key_ptr* result) {
  if (!parameters.empty()) return TEE_ERROR_BAD_PARAMETERS;
  attribute secret{TEE_ATTR_SECRET_VALUE, secret_bytes(bits / 8)};
  fill_random(secret.bytes);
  std::vector<attribute> attributes;
  attributes.push_back(std::move(secret));
  *result = std::make_shared<key>(type.id, bits, std::move(attributes), nullptr);
  return TEE_SUCCESS;
}

template <typename List>
auto find_in(const List& attributes, uint32_t id) {
  auto found =
      std::find_if(attributes.begin(), attributes.end(), [=](const auto& a) { return a.id == id; });
  return found == attributes.end() ? nullptr : &*found;
}

}  // namespace

const attribute* key::find(uint32_t id) const {
  return find_in(attributes_, id);
}

const attribute_view* find_attribute(std::span<const attribute_view> attributes, uint32_t id) {
  return find_in(attributes, id);
}

const char* attribute_list::add(const attribute_view& given) {
  const size_t place = type_.place_of(given.id);
  if (place == type_.attributes.size()) return "an attribute does not belong to the object's type";
  if (given_[place]) return "an attribute is given twice";
  given_[place] = true;
  views_[place] = given;
  return nullptr;
}

const char* attribute_list::complete() {
  for (size_t place = 0; place < type_.attributes.size(); ++place) {
    const bool mandatory = type_.attributes[place].presence == attribute_rule::MANDATORY;
    if (mandatory && !given_[place]) return "a mandatory attribute is missing";
    if (mandatory || !views_[place].bytes.empty()) views_[count_++] = views_[place];
  }
  return nullptr;
}

std::span<const uint8_t> without_leading_zeros(std::span<const uint8_t> number) {
  while (!number.empty() && number.front() == 0)
    number = number.subspan(1);
  return number;
}

TEE_Result load_key(const attribute_list& attributes, uint32_t max_bits, key_ptr* result) {
  const key_type& row = attributes.type();
  std::vector<attribute> own;
  own.reserve(attributes.views().size());
  for (const attribute_view& given : attributes.views()) {
    own.push_back(
        {given.id, secret_bytes(given.bytes.begin(), given.bytes.end()), given.a, given.b});
  }
  if (row.symmetric()) return load_symmetric(row, max_bits, std::move(own), result);
  if (row.has(TEE_ATTR_ECC_CURVE)) return load_ec_key(row.id, max_bits, std::move(own), result);
  return load_rsa_key(row.id, max_bits, std::move(own), result);
}

TEE_Result generate_key(uint32_t type, uint32_t bits, std::span<const attribute_view> parameters,
                        key_ptr* result) {
  const key_type& row = *find_key_type(type);
  if (row.symmetric()) return generate_symmetric(row, bits, parameters, result);
  if (type == TEE_TYPE_ECDSA_KEYPAIR) return generate_ec_key(bits, parameters, result);
  if (type == TEE_TYPE_RSA_KEYPAIR) return generate_rsa_key(bits, parameters, result);
  return TEE_ERROR_BAD_PARAMETERS;
}

}  // namespace tee::crypto
