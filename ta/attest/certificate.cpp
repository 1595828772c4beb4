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
constexpr uint32_t DIGITAL_SIGNATURE = 0;
constexpr uint32_t KEY_ENCIPHERMENT = 2;
constexpr uint32_t DATA_ENCIPHERMENT = 3;
constexpr size_t KEY_USAGE_BUFFER_SIZE = 100;
// No more memory than this is taken for a certificate, however large the client's buffer is. Its
// variable part, an application identifier, comes from the TA's heap as well.
constexpr size_t MAX_CERTIFICATE_SIZE = 16384;

template <size_t SIZE>
byte_view text_bytes(const char (&text)[SIZE]) {
  return {reinterpret_cast<const uint8_t*>(text), SIZE};
}

// The algorithm that the key names, if its keys can be attested.
keymaster_error_t choose_algorithm(const keymaster_key_param_set_t& key_params,
                                   const algorithm_t** algorithm) {
  const auto* tag = get_unique(key_params, KM_TAG_ALGORITHM);
  if (tag == nullptr) {
    trace_error("No KM_TAG_ALGORITHM");
    return KM_ERROR_UNKNOWN_ERROR;
  }
  *algorithm = find_algorithm(tag->enumerated);
  if (*algorithm != nullptr && (*algorithm)->set_key_info != nullptr) return KM_ERROR_OK;
  trace_error("Algorithm %d not implemented or attestation not supported",
              static_cast<int>(tag->enumerated));
  return KM_ERROR_UNSUPPORTED_ALGORITHM;
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

// One octet, its trailing zero bits included: clearing all eight first makes it that long.
int32_t fill_key_usage(const keymaster_key_param_set_t& key_params, ASN1_BIT_STRING* usage) {
  for (uint32_t bit = 0; bit < KEY_USAGE_BITS; bit++) {
    if (int32_t code = ASN1_BIT_STRING_set_bit(usage, bit, false)) return code;
  }
  for (const keymaster_key_param_t& param : key_params) {
    if (param.tag != KM_TAG_PURPOSE) continue;
    int32_t code = 0;
    if (param.enumerated == KM_PURPOSE_SIGN || param.enumerated == KM_PURPOSE_VERIFY) {
      code = ASN1_BIT_STRING_set_bit(usage, DIGITAL_SIGNATURE, true);
    } else if (param.enumerated == KM_PURPOSE_ENCRYPT || param.enumerated == KM_PURPOSE_DECRYPT) {
      code = ASN1_BIT_STRING_set_bit(usage, KEY_ENCIPHERMENT, true);
      if (code == 0) code = ASN1_BIT_STRING_set_bit(usage, DATA_ENCIPHERMENT, true);
    }
    if (code != 0) return code;
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
    trace_error("ASN1_BIT_STRING_set_bit return %d", filled);
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  if (length < 0) {
    trace_error("ASN1_BIT_STRING_write return %d", length);
    return KM_ERROR_UNKNOWN_ERROR;
  }
  X509_EXTENSION* extension = X509_EXTENSIONS_alloc_item(extensions);
  if (extension == nullptr) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  extension->id = &OID_KEY_USAGE;
  const byte_view value = byte_view(encoding).first(static_cast<size_t>(length));
  if (int32_t code = ASN1_OCTET_STRING_set(&extension->value, value)) {
    trace_error("ASN1_OCTET_STRING_set return %d", code);
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  return KM_ERROR_OK;
}

keymaster_error_t add_key_description(const keymaster_key_param_set_t& key_params,
                                      const keymaster_key_param_set_t& attest_params,
                                      X509_EXTENSIONS* extensions) {
  X509_EXTENSION* extension = X509_EXTENSIONS_alloc_item(extensions);
  if (extension == nullptr) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  // The whole set counts as enforced by the hardware.
  const keymaster_key_param_set_t software;
  return character_to_extension(key_params, software, attest_params, extension);
}

// Everything of the certificate but the key itself and its signature.
keymaster_error_t fill_certificate(const keymaster_key_param_set_t& key_params,
                                   const keymaster_key_param_set_t& attest_params,
                                   X509_CINF* cinf) {
  cinf->version = VERSION_3;
  cinf->has_version = 1;
  cinf->serial = SERIAL;
  X509_ALGOR_set_rsa(&cinf->signature, &OID_SHA256_WITH_RSA_ENCRYPTION);
  if (X509_NAME_add(&cinf->issuer, &OID_COMMON_NAME, text_bytes(ISSUER)) != 0 ||
      X509_NAME_add(&cinf->subject, &OID_COMMON_NAME, text_bytes(SUBJECT)) != 0) {
    return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  }
  set_validity(key_params, &cinf->validity);
  if (auto error = add_key_usage(key_params, &cinf->extensions)) return error;
  if (auto error = add_key_description(key_params, attest_params, &cinf->extensions)) {
    return error;
  }
  cinf->has_extensions = 1;
  return KM_ERROR_OK;
}

// Signs into `certificate`, which lies in TA memory.
keymaster_error_t sign_certificate(const keymaster_key_param_set_t& attest_params,
                                   const X509_CINF* cinf, heap_buffer* certificate) {
  const auto* algorithm = get_unique(attest_params, KM_TAG_ALGORITHM);
  keymaster_error_t error = KM_ERROR_OK;
  tee_object key;
  const TEE_Result res =
      get_attest_key(algorithm == nullptr ? KM_ALGORITHM_RSA : algorithm->enumerated, &key, &error);
  if (failed(res, error)) return error;
  const int32_t length = X509_CINF_sign(cinf, key, certificate->span());
  if (length == DER_TOO_SMALL || length == DER_NO_MEMORY) return KM_ERROR_MEMORY_ALLOCATION_FAILED;
  if (length < 0) return KM_ERROR_UNKNOWN_ERROR;
  certificate->truncate(static_cast<size_t>(length));
  return KM_ERROR_OK;
}

TEE_Result write_chain(byte_view certificate, byte_span output, size_t* produced, uint32_t* count) {
  output_cursor out(output);
  for (const byte_view link : {certificate, byte_view(ATTESTATION_KEY.certificate)}) {
    if (!out.write_field(link)) {
      trace_error("Too short buffer");
      return TEE_ERROR_GENERIC;
    }
    (*count)++;
  }
  *produced = out.written();
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result internal_attest_key(byte_view key_material, const keymaster_key_param_set_t& key_params,
                               const keymaster_key_param_set_t& attest_params, byte_span output,
                               size_t* produced, uint32_t* count, keymaster_error_t* km_error) {
  const trace_scope scope;
  *count = 0;
  const algorithm_t* algorithm = nullptr;
  *km_error = choose_algorithm(key_params, &algorithm);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  if (output.size() < sizeof(uint32_t)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short buffer");

  const asn1_owner<X509_CINF, X509_CINF_free> cinf(X509_CINF_alloc());
  if (!cinf) {
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  const TEE_Result res = algorithm->set_key_info(key_material, &cinf->key, km_error);
  if (failed(res, *km_error)) {
    if (*km_error == KM_ERROR_OK) *km_error = KM_ERROR_UNKNOWN_ERROR;
    return res;
  }
  *km_error = fill_certificate(key_params, attest_params, cinf.get());
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  heap_buffer certificate;
  if (!certificate.allocate(std::min(output.size() - sizeof(uint32_t), MAX_CERTIFICATE_SIZE))) {
    *km_error = KM_ERROR_MEMORY_ALLOCATION_FAILED;
    return TEE_SUCCESS;
  }
  *km_error = sign_certificate(attest_params, cinf.get(), &certificate);
  if (*km_error != KM_ERROR_OK) return TEE_SUCCESS;
  return write_chain(certificate.view(), output, produced, count);
}

}  // namespace keymaster
