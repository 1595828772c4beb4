// ECDSA.
#include "tee/crypto/ecdsa.h"

#include "tee/crypto/pkey.h"

namespace tee::crypto {
namespace {

// DER of a signature: SEQUENCE of two INTEGERs, with P-521 at most 3 + 2 * (2 + 67) bytes long.
constexpr size_t MAX_DER = 160;

const curve& curve_of(const key& ec_key) {
  return *curve_of_size(ec_key.bits());
}

// What to hand to libcrypto so that it signs `digest` as is. It drops the bits by which the bytes
// exceed the curve's bits, so a finished number of 521 bits in 66 bytes goes in shifted by 7 to the
// left; a number that does not fit then counts modulo the field's size in bits.
class representative {
 public:
  representative(const key& ec_key, std::span<const uint8_t> digest) : bytes_(digest) {
    const curve& on = curve_of(ec_key);
    auto surplus = static_cast<unsigned>(on.length() * 8 - on.bits);
    if (surplus == 0 || digest.size() != on.length()) return;
    shifted_.assign(digest.begin(), digest.end());
    for (size_t i = 0; i < shifted_.size(); ++i) {
      unsigned next = i + 1 < shifted_.size() ? shifted_[i + 1] : 0U;
      shifted_[i] = static_cast<uint8_t>(unsigned{shifted_[i]} << surplus | next >> (8 - surplus));
    }
    bytes_ = shifted_;
  }
  std::span<const uint8_t> bytes() const { return bytes_; }

 private:
  secret_bytes shifted_;
  std::span<const uint8_t> bytes_;
};

}  // namespace

size_t signature_length(const key& ec_key) {
  return 2 * curve_of(ec_key).length();
}

TEE_Result ecdsa_sign(key& ec_key, std::span<const uint8_t> digest, uint8_t* signature) {
  pkey_context context(ec_key, TEE_TYPE_ECDSA_KEYPAIR, TEE_MODE_SIGN,
                       [](EVP_PKEY_CTX* fresh) { return EVP_PKEY_sign_init(fresh) == 1; });
  representative value(ec_key, digest);
  uint8_t der[MAX_DER];
  size_t length = sizeof(der);
  if (EVP_PKEY_sign(context.get(), der, &length, value.bytes().data(), value.bytes().size()) != 1) {
    forget_errors();
    return TEE_ERROR_BAD_PARAMETERS;
  }
  const uint8_t* cursor = der;
  ecdsa_sig_ptr decoded(d2i_ECDSA_SIG(nullptr, &cursor, static_cast<long>(length)));
  must(decoded != nullptr, "d2i_ECDSA_SIG");
  int half = static_cast<int>(curve_of(ec_key).length());
  must(BN_bn2binpad(ECDSA_SIG_get0_r(decoded.get()), signature, half) == half &&
           BN_bn2binpad(ECDSA_SIG_get0_s(decoded.get()), signature + half, half) == half,
       "BN_bn2binpad");
  return TEE_SUCCESS;
}

bool ecdsa_verify(key& ec_key, std::span<const uint8_t> digest,
                  std::span<const uint8_t> signature) {
  if (signature.size() != signature_length(ec_key)) return false;
  size_t half = signature.size() / 2;
  ecdsa_sig_ptr parts(ECDSA_SIG_new());
  must(parts != nullptr, "ECDSA_SIG_new");
  ECDSA_SIG_set0(parts.get(), to_bignum(signature.first(half)).release(),
                 to_bignum(signature.last(half)).release());
  uint8_t der[MAX_DER];
  uint8_t* cursor = der;
  int length = i2d_ECDSA_SIG(parts.get(), &cursor);
  must(length > 0, "i2d_ECDSA_SIG");
  pkey_context context(ec_key, TEE_TYPE_ECDSA_KEYPAIR, TEE_MODE_VERIFY,
                       [](EVP_PKEY_CTX* fresh) { return EVP_PKEY_verify_init(fresh) == 1; });
  representative value(ec_key, digest);
  bool good = EVP_PKEY_verify(context.get(), der, static_cast<size_t>(length), value.bytes().data(),
                              value.bytes().size()) == 1;
  if (!good) forget_errors();
  return good;
}

}  // namespace tee::crypto
