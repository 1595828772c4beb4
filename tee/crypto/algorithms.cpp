// The tables of algorithms, key types and curves.
#include "tee/crypto/algorithms.h"

#include <algorithm>
#include <array>

namespace tee::crypto {
namespace {

constexpr uint32_t bit(uint32_t mode) {
  return uint32_t{1} << mode;
}
constexpr uint32_t DIGESTS = bit(TEE_MODE_DIGEST);
constexpr uint32_t MACS = bit(TEE_MODE_MAC);
constexpr uint32_t CRYPTS = bit(TEE_MODE_ENCRYPT) | bit(TEE_MODE_DECRYPT);
constexpr uint32_t SIGNS = bit(TEE_MODE_SIGN) | bit(TEE_MODE_VERIFY);
constexpr uint32_t RSA = TEE_TYPE_RSA_KEYPAIR;
constexpr uint32_t EC = TEE_TYPE_ECDSA_KEYPAIR;

constexpr algorithm digest_row(uint32_t id, hash h) {
  return {id, family::DIGEST, DIGESTS, 0, h};
}
constexpr algorithm hmac_row(uint32_t id, uint32_t key, hash h) {
  return {id, family::MAC, MACS, key, h};
}
constexpr algorithm aes_row(uint32_t id, family kind, block_mode mode) {
  return {id, kind, CRYPTS, TEE_TYPE_AES, hash::NONE, mode};
}
constexpr algorithm rsa_row(uint32_t id, family kind, rsa_padding padding, hash h = hash::NONE,
                            uint32_t more_modes = 0) {
  uint32_t modes = (kind == family::RSA_SIGNATURE ? SIGNS : CRYPTS) | more_modes;
  return {id, kind, modes, RSA, h, block_mode::NONE, padding};
}
// Named by its curve, for digests of any length.
constexpr algorithm ecdsa_row(uint32_t id, uint32_t bits) {
  return {id, family::ECDSA, SIGNS, EC, hash::NONE, block_mode::NONE, rsa_padding::NONE, bits};
}
// Named by its digest, for keys on any curve.
constexpr algorithm ecdsa_row(uint32_t id, hash h) {
  return {id, family::ECDSA, SIGNS, EC, h};
}

// Sorted by identifier.
constexpr std::array ALGORITHMS{
    aes_row(TEE_ALG_AES_ECB_NOPAD, family::CIPHER, block_mode::ECB),
    aes_row(TEE_ALG_AES_CBC_NOPAD, family::CIPHER, block_mode::CBC),
    aes_row(TEE_ALG_AES_CTR, family::CIPHER, block_mode::CTR),
    hmac_row(TEE_ALG_HMAC_MD5, TEE_TYPE_HMAC_MD5, hash::MD5),
    hmac_row(TEE_ALG_HMAC_SHA1, TEE_TYPE_HMAC_SHA1, hash::SHA1),
    hmac_row(TEE_ALG_HMAC_SHA224, TEE_TYPE_HMAC_SHA224, hash::SHA224),
    hmac_row(TEE_ALG_HMAC_SHA256, TEE_TYPE_HMAC_SHA256, hash::SHA256),
    hmac_row(TEE_ALG_HMAC_SHA384, TEE_TYPE_HMAC_SHA384, hash::SHA384),
    hmac_row(TEE_ALG_HMAC_SHA512, TEE_TYPE_HMAC_SHA512, hash::SHA512),
    aes_row(TEE_ALG_AES_GCM, family::AE, block_mode::GCM),
    digest_row(TEE_ALG_MD5, hash::MD5),
    digest_row(TEE_ALG_SHA1, hash::SHA1),
    digest_row(TEE_ALG_SHA224, hash::SHA224),
    digest_row(TEE_ALG_SHA256, hash::SHA256),
    digest_row(TEE_ALG_SHA384, hash::SHA384),
    digest_row(TEE_ALG_SHA512, hash::SHA512),
    rsa_row(TEE_ALG_RSA_NOPAD, family::RSA_ENCRYPTION, rsa_padding::NONE, hash::NONE,
            bit(TEE_MODE_EXPORT)),
    rsa_row(TEE_ALG_RSAES_PKCS1_V1_5, family::RSA_ENCRYPTION, rsa_padding::PKCS1),
    rsa_row(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA1),
    rsa_row(TEE_ALG_RSAES_OAEP_PLATFORM_SHA1, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA1),
    rsa_row(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA224, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA224),
    rsa_row(TEE_ALG_RSAES_OAEP_PLATFORM_SHA224, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA224),
    rsa_row(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA256),
    rsa_row(TEE_ALG_RSAES_OAEP_PLATFORM_SHA256, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA256),
    rsa_row(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA384, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA384),
    rsa_row(TEE_ALG_RSAES_OAEP_PLATFORM_SHA384, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA384),
    rsa_row(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA512, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA512),
    rsa_row(TEE_ALG_RSAES_OAEP_PLATFORM_SHA512, family::RSA_ENCRYPTION, rsa_padding::OAEP,
            hash::SHA512),
    ecdsa_row(TEE_ALG_ECDSA_P192, 192),
    ecdsa_row(TEE_ALG_ECDSA_SHA1, hash::SHA1),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_MD5, family::RSA_SIGNATURE, rsa_padding::PKCS1, hash::MD5),
    ecdsa_row(TEE_ALG_ECDSA_P224, 224),
    ecdsa_row(TEE_ALG_ECDSA_SHA224, hash::SHA224),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, family::RSA_SIGNATURE, rsa_padding::PKCS1, hash::SHA1),
    ecdsa_row(TEE_ALG_ECDSA_P256, 256),
    ecdsa_row(TEE_ALG_ECDSA_SHA256, hash::SHA256),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_SHA224, family::RSA_SIGNATURE, rsa_padding::PKCS1,
            hash::SHA224),
    ecdsa_row(TEE_ALG_ECDSA_P384, 384),
    ecdsa_row(TEE_ALG_ECDSA_SHA384, hash::SHA384),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, family::RSA_SIGNATURE, rsa_padding::PKCS1,
            hash::SHA256),
    ecdsa_row(TEE_ALG_ECDSA_P521, 521),
    ecdsa_row(TEE_ALG_ECDSA_SHA512, hash::SHA512),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_SHA384, family::RSA_SIGNATURE, rsa_padding::PKCS1,
            hash::SHA384),
    rsa_row(TEE_ALG_RSASSA_PKCS1_V1_5_SHA512, family::RSA_SIGNATURE, rsa_padding::PKCS1,
            hash::SHA512),
    rsa_row(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, family::RSA_SIGNATURE, rsa_padding::PSS,
            hash::SHA1),
    rsa_row(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224, family::RSA_SIGNATURE, rsa_padding::PSS,
            hash::SHA224),
    rsa_row(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, family::RSA_SIGNATURE, rsa_padding::PSS,
            hash::SHA256),
    rsa_row(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384, family::RSA_SIGNATURE, rsa_padding::PSS,
            hash::SHA384),
    rsa_row(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512, family::RSA_SIGNATURE, rsa_padding::PSS,
            hash::SHA512),
};
static_assert(std::is_sorted(ALGORITHMS.begin(), ALGORITHMS.end(),
                             [](const auto& a, const auto& b) { return a.id < b.id; }));

constexpr auto MANDATORY = attribute_rule::MANDATORY;
constexpr auto OPTIONAL = attribute_rule::OPTIONAL;
constexpr std::array SECRET{attribute_rule{TEE_ATTR_SECRET_VALUE, MANDATORY}};
// The five numbers of the Chinese remainder form come all or not at all.
constexpr std::array RSA_PAIR{attribute_rule{TEE_ATTR_RSA_MODULUS, MANDATORY},
                              attribute_rule{TEE_ATTR_RSA_PUBLIC_EXPONENT, MANDATORY},
                              attribute_rule{TEE_ATTR_RSA_PRIVATE_EXPONENT, MANDATORY},
                              attribute_rule{TEE_ATTR_RSA_PRIME1, OPTIONAL},
                              attribute_rule{TEE_ATTR_RSA_PRIME2, OPTIONAL},
                              attribute_rule{TEE_ATTR_RSA_EXPONENT1, OPTIONAL},
                              attribute_rule{TEE_ATTR_RSA_EXPONENT2, OPTIONAL},
                              attribute_rule{TEE_ATTR_RSA_COEFFICIENT, OPTIONAL}};
constexpr std::array EC_PAIR{attribute_rule{TEE_ATTR_ECC_CURVE, MANDATORY},
                             attribute_rule{TEE_ATTR_ECC_PUBLIC_VALUE_X, MANDATORY},
                             attribute_rule{TEE_ATTR_ECC_PUBLIC_VALUE_Y, MANDATORY},
                             attribute_rule{TEE_ATTR_ECC_PRIVATE_VALUE, MANDATORY}};
constexpr std::span<const attribute_rule> RSA_PUBLIC{RSA_PAIR.data(), 2};
constexpr std::span<const attribute_rule> EC_PUBLIC{EC_PAIR.data(), 3};

constexpr std::array KEY_TYPES{
    key_type{TEE_TYPE_AES, 128, 256, 64, SECRET},
    key_type{TEE_TYPE_HMAC_MD5, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_HMAC_SHA1, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_HMAC_SHA224, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_HMAC_SHA256, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_HMAC_SHA384, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_HMAC_SHA512, 8, 1024, 8, SECRET},
    key_type{TEE_TYPE_RSA_PUBLIC_KEY, 512, 8192, 8, RSA_PUBLIC},
    key_type{TEE_TYPE_RSA_KEYPAIR, 512, 8192, 8, RSA_PAIR},
    key_type{TEE_TYPE_ECDSA_PUBLIC_KEY, 192, 521, 0, EC_PUBLIC},
    key_type{TEE_TYPE_ECDSA_KEYPAIR, 192, 521, 0, EC_PAIR},
};
static_assert(std::all_of(KEY_TYPES.begin(), KEY_TYPES.end(), [](const key_type& row) {
  return row.attributes.size() <= MAX_ATTRIBUTES;
}));

constexpr std::array CURVES{curve{TEE_ECC_CURVE_NIST_P192, 192, "prime192v1"},
                            curve{TEE_ECC_CURVE_NIST_P224, 224, "secp224r1"},
                            curve{TEE_ECC_CURVE_NIST_P256, 256, "prime256v1"},
                            curve{TEE_ECC_CURVE_NIST_P384, 384, "secp384r1"},
                            curve{TEE_ECC_CURVE_NIST_P521, 521, "secp521r1"}};

template <typename Row, size_t N, typename Matches>
const Row* find_row(const std::array<Row, N>& rows, Matches&& matches) {
  auto row = std::find_if(rows.begin(), rows.end(), matches);
  return row == rows.end() ? nullptr : &*row;
}

}  // namespace

const algorithm* find_algorithm(uint32_t id) {
  auto row = std::lower_bound(ALGORITHMS.begin(), ALGORITHMS.end(), id,
                              [](const algorithm& a, uint32_t wanted) { return a.id < wanted; });
  return row != ALGORITHMS.end() && row->id == id ? &*row : nullptr;
}

bool key_type::allows(uint32_t bits) const {
  if (step_bits == 0) return curve_of_size(bits) != nullptr;
  return bits >= min_bits && bits <= max_bits && (bits - min_bits) % step_bits == 0;
}

size_t key_type::place_of(uint32_t attribute_id) const {
  size_t place = 0;
  while (place < attributes.size() && attributes[place].id != attribute_id)
    ++place;
  return place;
}

const key_type* find_key_type(uint32_t id) {
  return find_row(KEY_TYPES, [=](const key_type& row) { return row.id == id; });
}

const curve* find_curve(uint32_t id) {
  return find_row(CURVES, [=](const curve& row) { return row.id == id; });
}

const curve* curve_of_size(uint32_t bits) {
  return find_row(CURVES, [=](const curve& row) { return row.bits == bits; });
}

}  // namespace tee::crypto
