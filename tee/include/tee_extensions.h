// What the platform offers beyond GlobalPlatform: replay-protected storage, the boot seed, public
// key export, PSS salt codes, OAEP identifiers, and trace output.
#pragma once

#include <tee_internal_api.h>  // the platform's, which need not lie beside this file

#ifdef __cplusplus
extern "C" {
#endif

// TEE_STORAGE_RPMB: storage identifier of the replay-protected (RPMB) trusted storage. Same rules
// as TEE_STORAGE_PRIVATE; TEE_ERROR_ITEM_NOT_FOUND from open when the device has no such storage.
// A port may have given another value.
#ifndef TEE_STORAGE_RPMB
#define TEE_STORAGE_RPMB 0x80000001
#endif

// TEE_RPMB_MakeFileSystem: makes the replay-protected file system when it does not yet exist;
// erases nothing and may be called on every start. `state` receives a platform word. TEE_SUCCESS
// when the store is there, TEE_ERROR_NOT_SUPPORTED when the device has none.
TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state);

// GetBootSeed: fills `seed` with `length` bytes (32 at most) that stay the same for one boot of the
// device and are shared by its trusted applications. TEE_ERROR_BAD_PARAMETERS for another length.
TEE_Result GetBootSeed(void* seed, size_t length);

// TEE_MODE_EXPORT: operation mode whose only use is TEE_AsymmetricExport; allocated with
// TEE_ALG_RSA_NOPAD and a maximum key size of 0 (no limit) or the key's own size in bits.
#define TEE_MODE_EXPORT 8

// TEE_AsymmetricExport: writes the public half of the operation's key in `format`;
// TEE_EXPORT_FORMAT_SPKI is the DER SubjectPublicKeyInfo of RFC 5280. `length`: capacity on entry,
// bytes written on return, bytes needed with TEE_ERROR_SHORT_BUFFER.
#define TEE_EXPORT_FORMAT_SPKI 5
TEE_Result TEE_AsymmetricExport(TEE_OperationHandle operation, uint32_t format, void* buffer,
                                size_t* length);

// RSA-OAEP under the platform's identifiers: the digest of the name serves label and MGF1.
#define TEE_ALG_RSAES_OAEP_PLATFORM_SHA1 0x60212230
#define TEE_ALG_RSAES_OAEP_PLATFORM_SHA224 0x60312230
#define TEE_ALG_RSAES_OAEP_PLATFORM_SHA256 0x60412230
#define TEE_ALG_RSAES_OAEP_PLATFORM_SHA384 0x60512230
#define TEE_ALG_RSAES_OAEP_PLATFORM_SHA512 0x60612230

// Values of TEE_ATTR_RSA_PSS_SALT_LENGTH: as long as the digest; the longest that fits when
// signing, any length (read from the signature) when verifying.
#define TEE_PSS_SALT_DIGEST_LENGTH 0xFFFFFFFFu
#define TEE_PSS_SALT_MAX_LENGTH 0xFFFFFFFEu

// Trace levels, and the platform's trace output. TEE_TraceThreshold gives the highest level that is
// let through; TEE_TraceThread the calling thread's identifier, or 0 when it is not known;
// TEE_TraceWrite puts out one finished line of `length` bytes (with its newline) at `level`.
#define TEE_TRACE_ERROR 1
#define TEE_TRACE_INFO 2
#define TEE_TRACE_DEBUG 3
#define TEE_TRACE_FLOW 4
uint32_t TEE_TraceThreshold(void);
uint32_t TEE_TraceThread(void);
void TEE_TraceWrite(uint32_t level, const char* line, size_t length);

#ifdef __cplusplus
}
#endif
