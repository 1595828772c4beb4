// The certificate of an attested key, and the chain.
#include "ta/attest/certificate.h"

#include <algorithm>

#include "ta/alg/algorithm.h"
#include "ta/attest/attestation_key.h"
#include "ta/attest/key_description.h"
#include "ta/der/oids.h"

namespace keymaster {
namespace {

constexpr uint64_t VERSION_3 = 2;
constexpr uint64_t SERIAL = 1;
// Both names carry their terminating zero: relying parties know them so.
constexpr char ISSUER[] = "Android Keymaster";
constexpr char SUBJECT[] = "A Keymaster Key";
static_assert(sizeof(ISSUER) == 18 && sizeof(SUBJECT) == 16);
constexpr uint64_t NO_EXPIRY_SECONDS = 0xFFFFFFFF;
constexpr uint64_t EXPIRY_CLAMP_MS = 0xFFFFFFFF;

constexpr uint32_t KEY_USAGE_BITS = 8;
constexpr uint32_t DIGITAL_SIGNATURE = 1 << 0;
constexpr uint32_t ENCIPHERMENT = 1 << 2 | 1 << 3;  // of keys and of data
constexpr size_t KEY_USAGE_BUFFER_SIZE = 100;

template <size_t SIZE>
byte_view text_bytes(const char (&text)[SIZE]) {
  return {reinterpret_cast<const uint8_t*>(text), SIZE};
}

// The algorithm that the key names, if its keys can be attested.
keymaster_error_t choose_algorithm(const keymaster_key_param_set_t& key_params,
                                   const algorithm_t** algorithm) {
  const auto* tag = get_unique(key_params, KM_TAG_ALGORITHM);
  if (tag == nullptr) return refuse(KM_ERROR_UNKNOWN_ERROR, "No KM_TAG_ALGORITHM");
  *algorithm = find_algorithm(tag->enumerated);
  if (*algorithm != nullptr && (*algorithm)->set_key_info != nullptr) return KM_ERROR_OK;
  return refuse(KM_ERROR_UNSUPPORTED_ALGORITHM,
                "Algorithm %d not implemented or attestation not supported",
                static_cast<int>(tag->enumerated));
}

// Both dates are UTCTime whatever the year. An expiry whose milliseconds do not fit 32 bits is cut
// to their maximum before they become seconds: intended, though it is a day in 1970.
void set_validity(const keymaster_key_param_set_t& key_params, X509_VALIDITY* validity) {
  const auto* active = get_unique(key_params, KM_TAG_ACTIVE_DATETIME);
  const auto* expire = get_unique(key_params, KM_TAG_USAGE_EXPIRE_DATETIME);
  const uint64_t not_before = active == nullptr ? 0 : active->date_time / 1000;
  const uint64_t not_after =
      expire == nullptr ? NO_EXPIRY_SECONDS : std::min(expire->date_time, EXPIRY_CLAMP_MS) / 1000;
  validity->not_before = ASN1_TIME_from_seconds(DER_UTC_TIME, not_before);
  validity->not_after = ASN1_TIME_from_seconds(DER_UTC_TIME, not_after);
}

// One octet, its trailing zero bits included: clearing a bit makes the string that long.
int32_t fill_key_usage(const keymaster_key_param_set_t& key_params, ASN1_BIT_STRING* usage) {
  uint32_t bits = 0;
  for (const keymaster_key_param_t& param : key_params) {
    if (param.tag != KM_TAG_PURPOSE) continue;
    const uint32_t purpose = param.enumerated;
    if (purpose == KM_PURPOSE_SIGN || purpose == KM_PURPOSE_VERIFY) bits |= DIGITAL_SIGNATURE;
    if (purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_DECRYPT) bits |= ENCIPHERMENT;
  }
  for (uint32_t bit = 0; bit < KEY_USAGE_BITS; bit++) {
    if (int32_t code = ASN1_BIT_STRING_set_bit(usage, bit, (bits >> bit & 1) != 0)) return code;
  }
  return 0;
}

keymaster_error_t add_key_usage(const keymaster_key_param_set_t& key_params,
                                X509_EXTENSIONS* extensions) {
  ASN1_BIT_STRING usage{};
  uint8_t encoding[KEY_USAGE_BUFFER_SIZE];
  const int32_t filled = fill_key_usage(key_params, &usage);
  const int32_t length = asn1_encode(ASN1_BIT_STRING_TYPE, &usage, encoding);
  ASN1_BIT_STRING_TYPE.free(&usage);
  if (filled != 0) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "ASN1_BIT_STRING_set_bit return %d", filled);
  }
  if (length < 0) {
    return refuse(KM_ERROR_UNKNOWN_ERROR, "ASN1_BIT_STRING_write return %d", length);
  }
  X509_EXTENSION* extension = X509_EXTENSIONS_alloc_item(extensions);
  if (extension == nullptr) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  extension->id = &OID_KEY_USAGE;
  const byte_view value = byte_view(encoding).first(static_cast<size_t>(length));
  if (int32_t code = ASN1_OCTET_STRING_set(&extension->value, value)) {
    return refuse(KM_ERROR_MEMORY_ALLOCATION_FAILED, "ASN1_OCTET_STRING_set return %d", code);
  }
  return KM_ERROR_OK;
}

keymaster_error_t add_key_description(const attested_key& key, X509_EXTENSIONS* extensions) {
  X509_EXTENSION* extension = X509_EXTENSIONS_alloc_item(extensions);
  if (extension == nullptr) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  // The whole set counts as enforced by the hardware.
  const keymaster_key_param_set_t software;
  return character_to_extension(key.characteristics, software, key.params, extension);
}

// Everything of the certificate but the key itself and its signature.
keymaster_error_t fill_certificate(const attested_key& key, X509_CINF* cinf) {
  cinf->version = VERSION_3;
  cinf->has_version = 1;
  cinf->serial = SERIAL;
  X509_ALGOR_set_rsa(&cinf->signature, &OID_SHA256_WITH_RSA_ENCRYPTION);
  TRY(der_error(X509_NAME_add(&cinf->issuer, &OID_COMMON_NAME, text_bytes(ISSUER))));
  TRY(der_error(X509_NAME_add(&cinf->subject, &OID_COMMON_NAME, text_bytes(SUBJECT))));
  set_validity(key.characteristics, &cinf->validity);
  TRY(add_key_usage(key.characteristics, &cinf->extensions));
  TRY(add_key_description(key, &cinf->extensions));
  cinf->has_extensions = 1;
  return KM_ERROR_OK;
}

outcome sign_certificate(const keymaster_key_param_set_t& attest_params, const X509_CINF* cinf,
                         size_t capacity, heap_buffer* certificate) {
  const auto* algorithm = get_unique(attest_params, KM_TAG_ALGORITHM);
  tee_object key;
  TRY(get_attest_key(algorithm == nullptr ? KM_ALGORITHM_RSA : algorithm->enumerated, &key));
  return X509_CINF_sign(cinf, key, capacity, certificate);
}

// The Keymaster error of a step: a failure has one.
keymaster_error_t error_of(outcome how) {
  return failed(how) && how.error == KM_ERROR_OK ? KM_ERROR_UNKNOWN_ERROR : how.error;
}

TEE_Result write_chain(byte_view certificate, byte_span output, size_t* produced, uint32_t* count) {
  output_cursor out(output);
  for (const byte_view link : {certificate, byte_view(ATTESTATION_KEY.certificate)}) {
    if (!out.write_field(link)) return fail(TEE_ERROR_GENERIC, "Too short buffer");
    (*count)++;
  }
  *produced = out.written();
  return TEE_SUCCESS;
}

}  // namespace

outcome internal_attest_key(const attested_key& key, byte_span output, size_t* produced,
                            uint32_t* count) {
  const trace_scope scope;
  *count = 0;
  const algorithm_t* algorithm = nullptr;
  TRY(choose_algorithm(key.characteristics, &algorithm));
  const asn1_owner<X509_CINF, X509_CINF_free> cinf(X509_CINF_alloc());
  if (!cinf) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  const outcome has_key = algorithm->set_key_info(key.material, &cinf->key);
  if (failed(has_key)) return {has_key.tee, error_of(has_key)};
  TRY(fill_certificate(key, cinf.get()));
  if (output.size() < sizeof(uint32_t)) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  const size_t capacity = output.size() - sizeof(uint32_t);
  heap_buffer certificate;
  TRY(error_of(sign_certificate(key.params, cinf.get(), capacity, &certificate)));
  return write_chain(certificate.view(), output, produced, count);
}

}  // namespace keymaster
