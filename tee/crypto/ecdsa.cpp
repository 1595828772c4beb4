// ECDSA.
#include "tee/crypto/ecdsa.h"

#include <algorithm>
#include <openssl/asn1.h>

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

// enter: moves `rest` of libcrypto's own DER behind the header of an element that must have `tag`;
// gives the length of its content, which lies within `rest`.
size_t enter(std::span<const uint8_t>* rest, int tag) {
  const uint8_t* content = rest->data();
  long length = 0;
  int found = 0;
  int tag_class = 0;
  int flags =
      ASN1_get_object(&content, &length, &found, &tag_class, static_cast<long>(rest->size()));
  constexpr int BAD_OR_INDEFINITE = 0x81;
  must((flags & BAD_OR_INDEFINITE) == 0 && found == tag, "DER of a signature");
  *rest = rest->subspan(static_cast<size_t>(content - rest->data()));
  return static_cast<size_t>(length);
}

// take_number: the INTEGER at the head of `rest`, with leading zeros. Decoding it into a number of
// libcrypto's and writing that out costs 4,000 instructions more per signature.
void take_number(std::span<const uint8_t>* rest, std::span<uint8_t> padded) {
  const size_t length = enter(rest, V_ASN1_INTEGER);
  std::span<const uint8_t> number = rest->first(length);
  *rest = rest->subspan(length);
  must(!number.empty() && number[0] < 0x80, "DER of a signature");  // not negative
  if (number.size() > padded.size() && number[0] == 0) number = number.subspan(1);
  must(number.size() <= padded.size(), "DER of a signature");
  const size_t zeros = padded.size() - number.size();
  std::fill_n(padded.begin(), zeros, uint8_t{0});
  std::copy(number.begin(), number.end(), padded.subspan(zeros).begin());
}

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
  std::span<const uint8_t> rest(der, length);
  const size_t content = enter(&rest, V_ASN1_SEQUENCE);
  must(content == rest.size(), "DER of a signature");
  size_t half = curve_of(ec_key).length();
  take_number(&rest, {signature, half});
  take_number(&rest, {signature + half, half});
  must(rest.empty(), "DER of a signature");
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
