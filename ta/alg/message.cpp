// The data of an asymmetric operation, and the signatures over it.
#include "ta/alg/message.h"

#include <algorithm>

namespace keymaster {
namespace {

constexpr digest_t DIGESTS[] = {
    {KM_DIGEST_MD5, TEE_ALG_MD5, 16, 18},          {KM_DIGEST_SHA1, TEE_ALG_SHA1, 20, 15},
    {KM_DIGEST_SHA_2_224, TEE_ALG_SHA224, 28, 19}, {KM_DIGEST_SHA_2_256, TEE_ALG_SHA256, 32, 19},
    {KM_DIGEST_SHA_2_384, TEE_ALG_SHA384, 48, 19}, {KM_DIGEST_SHA_2_512, TEE_ALG_SHA512, 64, 19},
};

}  // namespace

const digest_t* find_digest(uint32_t digest) {
  const auto* row = std::ranges::find(DIGESTS, digest, &digest_t::digest);
  return row == std::end(DIGESTS) ? nullptr : row;
}

TEE_Result message_t::start_hash() {
  return hash.allocate(find_digest(digest)->algorithm, TEE_MODE_DIGEST, 0);
}

void message_t::append(byte_view input) {
  if (is_hashed()) {
    TEE_DigestUpdate(hash.get(), input.data(), static_cast<tee_size>(input.size()));
    return;
  }
  copy_bytes(buffer.span().subspan(length), input);
  length += input.size();
}

TEE_Result message_t::finish_hash() {
  return hash.digest_final({}, buffer.span(), &length);
}

TEE_Result sign_digest(const tee_operation& main, std::span<const TEE_Attribute> params,
                       byte_view digest, heap_buffer* signature) {
  auto size = static_cast<tee_size>(signature->size());
  TRY(checked(TEE_AsymmetricSignDigest(
                  main.get(), params.data(), static_cast<uint32_t>(params.size()), digest.data(),
                  static_cast<tee_size>(digest.size()), signature->data(), &size),
              "AsymmetricSignDigest"));
  signature->truncate(size);
  return TEE_SUCCESS;
}

outcome verify_digest(const tee_operation& main, std::span<const TEE_Attribute> params,
                      byte_view digest, byte_view signature) {
  const TEE_Result res =
      TEE_AsymmetricVerifyDigest(main.get(), params.data(), static_cast<uint32_t>(params.size()),
                                 digest.data(), static_cast<tee_size>(digest.size()),
                                 signature.data(), static_cast<tee_size>(signature.size()));
  if (res == TEE_SUCCESS) return DONE;
  if (res == TEE_ERROR_SIGNATURE_INVALID) return KM_ERROR_VERIFICATION_FAILED;
  return fail(res, "TEE_AsymmetricVerifyDigest return 0x%08x", res);
}

}  // namespace keymaster
