// The ATTK as a key of the platform, and public keys as PEM.
#include "ta/soter/attk.h"

#include "tee_extensions.h"

#include <algorithm>

#include "ta/alg/big_endian.h"
#include "ta/base/outcome.h"
#include "ta/soter/base64.h"
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

constexpr uint32_t ATTK_BITS = 2048;

// Above the public key of 8192 bits, so that a client's large buffer is no wish for as much memory.
constexpr size_t MAX_DER = 4096;

constexpr std::string_view PEM_BEGIN = "-----BEGIN PUBLIC KEY-----\n";
constexpr char PEM_END[] = "\n-----END PUBLIC KEY-----";  // its zero is part of the text

// The public key in DER. No key that fits the room for its PEM text has a longer one.
TEE_Result export_der(TEE_ObjectHandle key, uint32_t key_bits, size_t capacity, heap_buffer* der) {
  tee_operation operation;
  TEE_OperationHandle handle{};
  if (TEE_Result res =
          TEE_AllocateOperation(&handle, TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, key_bits)) {
    return fail(res, "TEE_AllocateOperation failed: %08x\n", res);
  }
  operation.reset(handle);
  if (TEE_Result res = TEE_SetOperationKey(operation.get(), key)) {
    return fail(res, "TEE_SetOperationKey failed: %08x\n", res);
  }
  if (!der->allocate(capacity)) return fail(TEE_ERROR_OUT_OF_MEMORY, "Out of memory");
  auto length = static_cast<tee_size>(capacity);
  if (TEE_Result res =
          TEE_AsymmetricExport(operation.get(), TEE_EXPORT_FORMAT_SPKI, der->data(), &length)) {
    return fail(res, "TEE_AsymmetricExport failed: %08x\n", res);
  }
  der->truncate(length);
  return TEE_SUCCESS;
}

// The key as the platform takes it: numbers without leading zeros, none longer than the modulus,
// and that no longer than the object. A platform may end the TA for others.
TEE_Result populate_attk(const soter_key_pair_t& key, TEE_ObjectHandle object) {
  const std::pair<uint32_t, byte_view> numbers[] = {
      {TEE_ATTR_RSA_MODULUS, key.n.view()},          {TEE_ATTR_RSA_PUBLIC_EXPONENT, key.e.view()},
      {TEE_ATTR_RSA_PRIVATE_EXPONENT, key.d.view()}, {TEE_ATTR_RSA_PRIME1, key.p.view()},
      {TEE_ATTR_RSA_PRIME2, key.q.view()},           {TEE_ATTR_RSA_EXPONENT1, key.dp.view()},
      {TEE_ATTR_RSA_EXPONENT2, key.dq.view()},       {TEE_ATTR_RSA_COEFFICIENT, key.qinv.view()},
  };
  const size_t modulus_size = without_leading_zeros(key.n.view()).size();
  if (modulus_size > ATTK_BITS / 8) return TEE_ERROR_BAD_PARAMETERS;
  TEE_Attribute attributes[std::size(numbers)];
  const uint32_t count = key.p.size() == 0 ? 3 : 8;
  for (uint32_t i = 0; i < count; i++) {
    const byte_view number = without_leading_zeros(numbers[i].second);
    if (number.size() > modulus_size) return TEE_ERROR_BAD_PARAMETERS;
    attributes[i] = ref_attribute(numbers[i].first, number);
  }
  return TEE_PopulateTransientObject(object, attributes, count);
}

}  // namespace

tee_object convert_key_to_object(const soter_key_pair_t& key_pair, uint32_t* key_bits) {
  const trace_scope scope;
  *key_bits = ATTK_BITS;
  tee_object object;
  if (TEE_Result res =
          TEE_AllocateTransientObject(TEE_TYPE_RSA_KEYPAIR, ATTK_BITS, object.receive())) {
    trace(TEE_TRACE_ERROR, "TEE_AllocateTransientObject failed: %08x\n", res);
    return {};
  }
  if (TEE_Result res = populate_attk(key_pair, object.get())) {
    trace(TEE_TRACE_ERROR, "TEE_PopulateTransientObject failed: %08x\n", res);
    return {};
  }
  return object;
}

TEE_Result export_rsa_public_key(TEE_ObjectHandle key, uint32_t key_bits, byte_span buffer,
                                 size_t* length) {
  const trace_scope scope;
  *length = 0;
  heap_buffer der;
  TRY(export_der(key, key_bits, std::min(buffer.size(), MAX_DER), &der));
  heap_buffer base64;
  if (!base64_encode(der.view(), &base64)) return TEE_ERROR_OUT_OF_MEMORY;
  output_cursor out(buffer);
  if (buffer.size() < PEM_BEGIN.size() + base64.size() + sizeof(PEM_END) ||
      !out.write_bytes(text_bytes(PEM_BEGIN)) || !out.write_bytes(base64.view()) ||
      !out.write_bytes(text_bytes({PEM_END, sizeof(PEM_END)}))) {
    return TEE_ERROR_SHORT_BUFFER;
  }
  *length = out.written();
  return TEE_SUCCESS;
}

}  // namespace keymaster
