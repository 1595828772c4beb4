// The two sides of the calls that the adapter stands in front of. The linker is told to wrap them
// (wrapped_calls.ld): what the trusted application calls by its published name arrives here, and
// the platform's own function is reached under another name.
#pragma once

#include "tee_extensions.h"
#include "tee_internal_api.h"

// wrapped_X: what the linker binds TEE_X of the trusted application to. Contracts are those of
// TEE_X. platform_X: TEE_X of the platform.
#define ADAPTER_WRAPPED(name) __asm__("__wrap_" #name)
#define ADAPTER_PLATFORM(name, call) extern "C" decltype(call) name __asm__("__real_" #call);

namespace keymaster::adapter {

using tee_size = decltype(TEE_Param{}.memref.size);

ADAPTER_PLATFORM(platform_allocate_operation, TEE_AllocateOperation)
ADAPTER_PLATFORM(platform_set_operation_key, TEE_SetOperationKey)
ADAPTER_PLATFORM(platform_free_operation, TEE_FreeOperation)
ADAPTER_PLATFORM(platform_encrypt, TEE_AsymmetricEncrypt)
ADAPTER_PLATFORM(platform_decrypt, TEE_AsymmetricDecrypt)
ADAPTER_PLATFORM(platform_sign_digest, TEE_AsymmetricSignDigest)
ADAPTER_PLATFORM(platform_verify_digest, TEE_AsymmetricVerifyDigest)
ADAPTER_PLATFORM(platform_populate, TEE_PopulateTransientObject)

}  // namespace keymaster::adapter
