// Signatures over the documents of SOTER keys, and the record that carries both to the client:
//   0 N, u32 | 4 document with its zero byte, N | 4 + N signature, the signing key's size
#pragma once

#include "ta/alg/rsa/rsa_operation.h"
#include "ta/base/heap.h"

namespace keymaster {

// signed_document_size, write_signed_document: the record's size in bytes, and the record into
// `room`, which has that size at least.
[[nodiscard]] uint64_t signed_document_size(byte_view document, byte_view signature);
[[nodiscard]] bool write_signed_document(byte_view document, byte_view signature, byte_span room);

// soter_do_sign_finish: signs `document` with the hash, key and padding of a sign operation. With
// KM_DIGEST_NONE there is no signature for it: TEE_ERROR_OUT_OF_MEMORY when it is longer than the
// key, else TEE_ERROR_BAD_STATE. TEE_ERROR_OUT_OF_MEMORY; a code of the platform.
[[nodiscard]] TEE_Result soter_do_sign_finish(rsa_sign_operation_t* operation, byte_view document,
                                              heap_buffer* signature);

// do_digest_with_sha: the SHA-256 of `data`. `digest` has room for its 32 bytes.
[[nodiscard]] TEE_Result do_digest_with_sha(byte_view data, byte_span digest);

// do_sign_with_rsa: the RSASSA-PKCS1-v1_5 signature (RFC 8017) of a SHA-256 `digest` with a key of
// `key_bits`. TEE_ERROR_OUT_OF_MEMORY; a code of the platform.
[[nodiscard]] TEE_Result do_sign_with_rsa(TEE_ObjectHandle key, uint32_t key_bits, byte_view digest,
                                          heap_buffer* signature);

// digest_and_sign: both.
[[nodiscard]] TEE_Result digest_and_sign(TEE_ObjectHandle key, uint32_t key_bits, byte_view data,
                                         heap_buffer* signature);

}  // namespace keymaster
