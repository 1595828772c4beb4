// The data of an asymmetric operation, and the signatures over it.
#include "ta/alg/message.h"

#include "ta/base/results.h"

namespace keymaster {
namespace {

constexpr digest_t DIGESTS[] = {
    {KM_DIGEST_MD5, TEE_ALG_MD5, 16},          {KM_DIGEST_SHA1, TEE_ALG_SHA1, 20},
    {KM_DIGEST_SHA_2_224, TEE_ALG_SHA224, 28}, {KM_DIGEST_SHA_2_256, TEE_ALG_SHA256, 32},
    {KM_DIGEST_SHA_2_384, TEE_ALG_SHA384, 48}, {KM_DIGEST_SHA_2_512, TEE_ALG_SHA512, 64},
};

}  // namespace

const digest_t* find_digest(uint32_t digest) {
  for (const digest_t& row : DIGESTS) {
    if (row.digest == digest) return &row;
  }
  return nullptr;
}

TEE_Result message_t::start_hash() {
  return hash.allocate(find_digest(digest)->algorithm, TEE_MODE_DIGEST, 0);
}

TEE_Result message_t::finish_hash() {
  return hash.digest_final({}, buffer.span(), &length);
}

void message_t::append(byte_view input) {
  copy_bytes(buffer.span().subspan(length), input);
  length += input.size();
}

TEE_Result sign_digest(const tee_operation& main, std::span<const TEE_Attribute> params,
                       byte_view digest, heap_buffer* signature) {
  auto size = static_cast<tee_size>(signature->size());
  const TEE_Result res = TEE_AsymmetricSignDigest(
      main.get(), params.data(), static_cast<uint32_t>(params.size()), digest.data(),
      static_cast<tee_size>(digest.size()), signature->data(), &size);
  if (res != TEE_SUCCESS) {
    trace_error("AsymmetricSignDigest failed with 0x%08x\n", res);
    return res;
  }
  signature->truncate(size);
  return TEE_SUCCESS;
}

TEE_Result verify_digest(const tee_operation& main, std::span<const TEE_Attribute> params,
                         byte_view digest, byte_view signature, keymaster_error_t* km_error) {
  const TEE_Result res =
      TEE_AsymmetricVerifyDigest(main.get(), params.data(), static_cast<uint32_t>(params.size()),
                                 digest.data(), static_cast<tee_size>(digest.size()),
                                 signature.data(), static_cast<tee_size>(signature.size()));
  if (res == TEE_ERROR_SIGNATURE_INVALID) {
    *km_error = KM_ERROR_VERIFICATION_FAILED;
    return TEE_SUCCESS;
  }
  if (res != TEE_SUCCESS) {
    trace_error("TEE_AsymmetricVerifyDigest return 0x%08x", res);
  }
  return res;
}

}  // namespace keymaster
