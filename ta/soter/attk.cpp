// The ATTK as a key of the platform, and public keys as PEM.
#include "ta/soter/attk.h"

#include "tee_extensions.h"

#include <algorithm>
#include <string_view>

#include "ta/base/results.h"
#include "ta/soter/base64.h"

namespace keymaster {
namespace {

constexpr uint32_t ATTK_BITS = 2048;

// Above the public key of 8192 bits, so that a client's large buffer is no wish for as much memory.
constexpr size_t MAX_DER = 4096;

constexpr std::string_view PEM_BEGIN = "-----BEGIN PUBLIC KEY-----\n";
constexpr std::string_view PEM_END = "\n-----END PUBLIC KEY-----";
constexpr uint8_t PEM_TERMINATOR[] = {0};

byte_view text_bytes(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// The public key in DER. No key that fits the room for its PEM text has a longer one.
TEE_Result export_der(TEE_ObjectHandle key, uint32_t key_bits, size_t capacity, heap_buffer* der) {
  tee_operation operation;
  TEE_OperationHandle handle{};
  if (TEE_Result res =
          TEE_AllocateOperation(&handle, TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, key_bits)) {
    trace_error("TEE_AllocateOperation failed: %08x\n", res);
    return res;
  }
  operation.reset(handle);
  if (TEE_Result res = TEE_SetOperationKey(operation.get(), key)) {
    trace_error("TEE_SetOperationKey failed: %08x\n", res);
    return res;
  }
  if (!der->allocate(capacity)) {
    trace_error("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  size_t length = capacity;
  if (TEE_Result res =
          TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI, der->data(), &length)) {
    trace_error("TEE_AsymmetricExport failed: %08x\n", res);
    return res;
  }
  der->truncate(length);
  return TEE_SUCCESS;
}

}  // namespace

tee_object convert_key_to_object(const soter_key_pair_t& key_pair, uint32_t* key_bits) {
  const trace_scope scope;
  *key_bits = ATTK_BITS;
  tee_object object;
  if (TEE_Result res =
          TEE_AllocateTransientObject(TEE_TYPE_RSA_KEYPAIR, ATTK_BITS, object.receive())) {
    TRACE_ERROR("TEE_AllocateTransientObject failed: %08x\n", res);
    return {};
  }
  const TEE_Attribute attributes[] = {
      ref_attribute(TEE_ATTR_RSA_MODULUS, key_pair.n.view()),
      ref_attribute(TEE_ATTR_RSA_PUBLIC_EXPONENT, key_pair.e.view()),
      ref_attribute(TEE_ATTR_RSA_PRIVATE_EXPONENT, key_pair.d.view()),
      ref_attribute(TEE_ATTR_RSA_PRIME1, key_pair.p.view()),
      ref_attribute(TEE_ATTR_RSA_PRIME2, key_pair.q.view()),
      ref_attribute(TEE_ATTR_RSA_EXPONENT1, key_pair.dp.view()),
      ref_attribute(TEE_ATTR_RSA_EXPONENT2, key_pair.dq.view()),
      ref_attribute(TEE_ATTR_RSA_COEFFICIENT, key_pair.qinv.view()),
  };
  const uint32_t count = key_pair.p.size() == 0 ? 3 : 8;
  if (TEE_Result res = TEE_PopulateTransientObject(object.get(), attributes, count)) {
    TRACE_ERROR("TEE_PopulateTransientObject failed: %08x\n", res);
    return {};
  }
  return object;
}

TEE_Result export_rsa_public_key(TEE_ObjectHandle key, uint32_t key_bits, byte_span buffer,
                                 size_t* length) {
  const trace_scope scope;
  *length = 0;
  heap_buffer der;
  if (TEE_Result res = export_der(key, key_bits, std::min(buffer.size(), MAX_DER), &der)) {
    return res;
  }
  heap_buffer base64;
  if (!base64_encode(der.view(), &base64)) return TEE_ERROR_OUT_OF_MEMORY;
  if (buffer.size() < PEM_BEGIN.size() + base64.size() + PEM_END.size() + sizeof(PEM_TERMINATOR)) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  output_cursor out(buffer);
  if (!out.write_bytes(text_bytes(PEM_BEGIN)) || !out.write_bytes(base64.view()) ||
      !out.write_bytes(text_bytes(PEM_END)) || !out.write_bytes(PEM_TERMINATOR)) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  *length = out.written();
  return TEE_SUCCESS;
}

}  // namespace keymaster
