// The export of SOTER keys: who signs, and what comes out.
#include "ta/soter/export.h"

#include "ta/alg/rsa/rsa.h"
#include "ta/base/outcome.h"
#include "ta/soter/attk.h"
#include "ta/soter/documents.h"
#include "ta/soter/provisioning.h"
#include "ta/soter/signing.h"
#include "ta/store/key_blob.h"

namespace keymaster {
namespace {

// The key of a blob; none unless it opens and holds an RSA key. Nothing else of the blob counts.
tee_object retrieve_key_from_pobj(byte_view blob, uint32_t* key_bits) {
  const trace_scope scope;
  heap_buffer material;
  keymaster_key_param_set_t characteristics;
  if (failed(open_key(blob, &material, &characteristics))) {
    trace(TEE_TRACE_ERROR, "Open key failed");
    return {};
  }
  const auto* algorithm = get_unique(characteristics, KM_TAG_ALGORITHM);
  if (algorithm == nullptr || algorithm->enumerated != KM_ALGORITHM_RSA) {
    trace(TEE_TRACE_ERROR, "Sign key is not an RSA key");
    return {};
  }
  return resolve_key_from_data(material.view(), key_bits);
}

// The blob of the signing key; empty when there is none.
byte_view sign_key_blob(const keymaster_key_param_set_t& key_params) {
  const byte_view blob = unique_blob(key_params, KM_TAG_SOTER_SIGN_KEY_BLOB);
  if (!blob.empty()) {
    trace(TEE_TRACE_DEBUG, "use key blob argument to retrieve sign key\n");
    return blob;
  }
  const byte_view name = unique_blob(key_params, KM_TAG_SOTER_SIGN_KEY_NAME);
  if (!name.empty()) {
    trace(TEE_TRACE_DEBUG, "use key name argument as key blob to retrieve sign key\n");
  }
  return name;
}

// Leaves *key empty when whoever is to sign has no key that the platform takes.
TEE_Result choose_sign_key(const keymaster_key_param_set_t& key_params, tee_object* key,
                           uint32_t* key_bits) {
  if (contains_tag(key_params, KM_TAG_SOTER_ATTK_SIGNS)) {
    trace(TEE_TRACE_DEBUG, "soter use attkey sign\n");
    if (TEE_Result res = soter_check_init()) return fail(res, "soter is not ready\n");
    *key = convert_key_to_object(soter_key_pair(), key_bits);
    return TEE_SUCCESS;
  }
  if (!contains_tag(key_params, KM_TAG_SOTER_KEY_SIGNS)) return TEE_ERROR_BAD_PARAMETERS;
  trace(TEE_TRACE_DEBUG, "soter use normal key sign\n");
  const byte_view blob = sign_key_blob(key_params);
  if (blob.empty()) return fail(TEE_ERROR_ITEM_NOT_FOUND, "no sign key with key blob\n");
  *key = retrieve_key_from_pobj(blob, key_bits);
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result soter_enhance_export_key(const keymaster_key_param_set_t& key_params,
                                    byte_view key_material, byte_span output, size_t* length) {
  const trace_scope scope;
  *length = 0;
  heap_buffer document;
  TRY(produce_soter_export_json(key_params, key_material, &document));
  tee_object key;
  uint32_t key_bits = 0;
  TRY(choose_sign_key(key_params, &key, &key_bits));
  if (!key) return fail(TEE_ERROR_BAD_STATE, "Sign key is null\n");
  heap_buffer signature;
  if (TEE_Result res = digest_and_sign(key.get(), key_bits, document.view(), &signature)) {
    return fail(res, "sign data error 0x%x\n", res);
  }
  const uint64_t size = signed_document_size(document.view(), signature.view());
  if (output.size() < size || !write_signed_document(document.view(), signature.view(), output)) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  *length = static_cast<size_t>(size);
  return TEE_SUCCESS;
}

}  // namespace keymaster
