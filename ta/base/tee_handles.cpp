// Owners of the platform's objects and operations.
#include "ta/base/tee_handles.h"

#include "ta/base/outcome.h"

namespace keymaster {

TEE_Attribute ref_attribute(uint32_t id, byte_view bytes) {
  TEE_Attribute attribute{};
  TEE_InitRefAttribute(&attribute, id, bytes.data(), static_cast<tee_size>(bytes.size()));
  return attribute;
}

TEE_Attribute value_attribute(uint32_t id, uint32_t a, uint32_t b) {
  TEE_Attribute attribute{};
  TEE_InitValueAttribute(&attribute, id, a, b);
  return attribute;
}

TEE_Result tee_object::allocate(uint32_t type, uint32_t max_bits) {
  return checked(TEE_AllocateTransientObject(type, max_bits, receive()), "AllocateTransientObject");
}

TEE_Result tee_object::populate(std::span<const TEE_Attribute> attributes) {
  return checked(TEE_PopulateTransientObject(handle_, attributes.data(),
                                             static_cast<uint32_t>(attributes.size())),
                 "PopulateTransientObject");
}

TEE_Result tee_object::generate(uint32_t bits, std::span<const TEE_Attribute> parameters) {
  return checked(
      TEE_GenerateKey(handle_, bits, parameters.data(), static_cast<uint32_t>(parameters.size())),
      "GenerateKey");
}

TEE_Result tee_object::read_attribute(uint32_t id, byte_span buffer, size_t* length) const {
  tee_size size = static_cast<tee_size>(buffer.size());
  const TEE_Result res = checked(TEE_GetObjectBufferAttribute(handle_, id, buffer.data(), &size),
                                 "GetObjectBufferAttribute");
  *length = res == TEE_SUCCESS ? size : 0;
  return res;
}

void tee_object::reset(TEE_ObjectHandle handle) {
  if (*this) TEE_CloseObject(handle_);
  handle_ = handle;
}

TEE_Result tee_operation::allocate(uint32_t algorithm, uint32_t mode, uint32_t max_key_bits) {
  reset();
  return checked(TEE_AllocateOperation(&handle_, algorithm, mode, max_key_bits),
                 "AllocateOperation");
}

TEE_Result tee_operation::set_key(TEE_ObjectHandle key) {
  return checked(TEE_SetOperationKey(handle_, key), "SetOperationKey");
}

TEE_Result tee_operation::digest_final(byte_view last, byte_span digest, size_t* length) {
  tee_size size = static_cast<tee_size>(digest.size());
  const TEE_Result res =
      checked(TEE_DigestDoFinal(handle_, last.data(), static_cast<tee_size>(last.size()),
                                digest.data(), &size),
              "DigestDoFinal");
  *length = res == TEE_SUCCESS ? size : 0;
  return res;
}

TEE_Result tee_operation::mac_final(byte_view last, byte_span mac, size_t* length) {
  tee_size size = static_cast<tee_size>(mac.size());
  const TEE_Result res =
      checked(TEE_MACComputeFinal(handle_, last.data(), static_cast<tee_size>(last.size()),
                                  mac.data(), &size),
              "MACComputeFinal");
  *length = res == TEE_SUCCESS ? size : 0;
  return res;
}

TEE_Result tee_operation::ae_init(byte_view nonce, uint32_t tag_bits) {
  // The lengths of associated data and payload matter to CCM alone.
  return checked(
      TEE_AEInit(handle_, nonce.data(), static_cast<tee_size>(nonce.size()), tag_bits, 0, 0),
      "AEInit");
}

TEE_Result tee_operation::ae_update(byte_view input, byte_span output, size_t* produced) {
  tee_size size = static_cast<tee_size>(output.size());
  const TEE_Result res =
      checked(TEE_AEUpdate(handle_, input.data(), static_cast<tee_size>(input.size()),
                           output.data(), &size),
              "AEUpdate");
  *produced = res == TEE_SUCCESS ? size : 0;
  return res;
}

void tee_operation::reset(TEE_OperationHandle handle) {
  if (*this) TEE_FreeOperation(handle_);
  handle_ = handle;
}

}  // namespace keymaster
