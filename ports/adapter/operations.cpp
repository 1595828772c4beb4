// Allocation, keys and release of operations.
#include "ports/adapter/operations.h"

#include "ta/alg/big_endian.h"

namespace keymaster::adapter {
namespace {

// Instance state: a trusted application has one thread.
known_operation* operations = nullptr;

// An algorithm that a standard platform does not take as it comes, and what it is given instead.
struct choice_t {
  uint32_t algorithm;
  uint32_t mode;
  role purpose;
  uint32_t platform_algorithm;
  uint32_t platform_mode;
  uint32_t digest;
};

// Verification with a salt of any length needs the block that was signed: a raw public operation.
constexpr choice_t pss_sign(uint32_t algorithm, uint32_t digest) {
  return {algorithm, TEE_MODE_SIGN, role::PSS_SIGN, algorithm, TEE_MODE_SIGN, digest};
}
constexpr choice_t pss_verify(uint32_t algorithm, uint32_t digest) {
  return {algorithm,         TEE_MODE_VERIFY,  role::PSS_VERIFY,
          TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, digest};
}
constexpr choice_t raw(uint32_t mode) {
  return {TEE_ALG_RSA_NOPAD, mode, role::RAW, TEE_ALG_RSA_NOPAD, mode, 0};
}

constexpr choice_t CHOICES[] = {
    pss_sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, TEE_ALG_SHA1),
    pss_sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224, TEE_ALG_SHA224),
    pss_sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, TEE_ALG_SHA256),
    pss_sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384, TEE_ALG_SHA384),
    pss_sign(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512, TEE_ALG_SHA512),
    pss_verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, TEE_ALG_SHA1),
    pss_verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224, TEE_ALG_SHA224),
    pss_verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, TEE_ALG_SHA256),
    pss_verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384, TEE_ALG_SHA384),
    pss_verify(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512, TEE_ALG_SHA512),
    raw(TEE_MODE_ENCRYPT),
    raw(TEE_MODE_DECRYPT),
    {TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, role::EXPORT, 0, 0, 0},
};

const choice_t* find_choice(uint32_t algorithm, uint32_t mode) {
  for (const choice_t& choice : CHOICES) {
    if (choice.algorithm == algorithm && choice.mode == mode) return &choice;
  }
  return nullptr;
}

// The platform's own OAEP identifiers differ from the standard's in one bit of the second byte.
uint32_t standard_algorithm(uint32_t algorithm) {
  switch (algorithm) {
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA1:
      return TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1;
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA224:
      return TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA224;
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA256:
      return TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256;
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA384:
      return TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA384;
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA512:
      return TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA512;
    default:
      return algorithm;
  }
}

// An export operation's handle is the address of its record, which is on the TA's heap, where no
// handle of the platform can lie while the record lives.
TEE_Result allocate_known(const choice_t& choice, uint32_t max_bits, TEE_OperationHandle* handle) {
  heap_ptr<known_operation> made(heap_new<known_operation>());
  if (!made) return TEE_ERROR_OUT_OF_MEMORY;
  made->purpose = choice.purpose;
  made->digest = choice.digest;
  if (choice.purpose == role::EXPORT) {
    made->handle = reinterpret_cast<TEE_OperationHandle>(made.get());
  } else if (TEE_Result res = platform_allocate_operation(&made->handle, choice.platform_algorithm,
                                                          choice.platform_mode, max_bits)) {
    return res;
  }
  *handle = made->handle;
  made->next = operations;
  operations = made.release();
  return TEE_SUCCESS;
}

// Public numbers can be read from every key. How long one is, the platform alone knows.
TEE_Result read_number(TEE_ObjectHandle key, uint32_t id, heap_buffer* number) {
  tee_size size = 0;
  TEE_Result res = TEE_GetObjectBufferAttribute(key, id, nullptr, &size);
  if (res != TEE_ERROR_SHORT_BUFFER) return res == TEE_SUCCESS ? TEE_ERROR_BAD_STATE : res;
  heap_buffer bytes;
  if (!bytes.allocate(size)) return TEE_ERROR_OUT_OF_MEMORY;
  res = TEE_GetObjectBufferAttribute(key, id, bytes.data(), &size);
  if (res != TEE_SUCCESS) return res;
  bytes.truncate(size);
  bytes.keep(without_leading_zeros(bytes.view()));
  *number = std::move(bytes);
  return TEE_SUCCESS;
}

TEE_Result remember_key(known_operation* operation, TEE_ObjectHandle key) {
  if (operation->purpose == role::RAW) return TEE_SUCCESS;
  if (TEE_Result res = read_number(key, TEE_ATTR_RSA_MODULUS, &operation->modulus)) return res;
  if (operation->purpose != role::EXPORT) return TEE_SUCCESS;
  return read_number(key, TEE_ATTR_RSA_PUBLIC_EXPONENT, &operation->exponent);
}

}  // namespace

known_operation* find_operation(TEE_OperationHandle handle) {
  known_operation* found = operations;
  while (found != nullptr && found->handle != handle)
    found = found->next;
  return found;
}

extern "C" TEE_Result wrapped_allocate_operation(TEE_OperationHandle* operation, uint32_t algorithm,
                                                 uint32_t mode, uint32_t max_bits)
    ADAPTER_WRAPPED(TEE_AllocateOperation);
TEE_Result wrapped_allocate_operation(TEE_OperationHandle* operation, uint32_t algorithm,
                                      uint32_t mode, uint32_t max_bits) {
  *operation = TEE_OperationHandle{};
  if (const choice_t* choice = find_choice(algorithm, mode)) {
    return allocate_known(*choice, max_bits, operation);
  }
  return platform_allocate_operation(operation, standard_algorithm(algorithm), mode, max_bits);
}

extern "C" TEE_Result wrapped_set_operation_key(TEE_OperationHandle operation, TEE_ObjectHandle key)
    ADAPTER_WRAPPED(TEE_SetOperationKey);
TEE_Result wrapped_set_operation_key(TEE_OperationHandle operation, TEE_ObjectHandle key) {
  known_operation* known = find_operation(operation);
  if (known != nullptr) {
    if (TEE_Result res = remember_key(known, key)) return res;
    if (known->purpose == role::EXPORT) return TEE_SUCCESS;
  }
  return platform_set_operation_key(operation, key);
}

extern "C" void wrapped_free_operation(TEE_OperationHandle operation)
    ADAPTER_WRAPPED(TEE_FreeOperation);
void wrapped_free_operation(TEE_OperationHandle operation) {
  known_operation** link = &operations;
  while (*link != nullptr && (*link)->handle != operation)
    link = &(*link)->next;
  const heap_ptr<known_operation> known(*link);
  if (known) {
    *link = known->next;
    if (known->purpose == role::EXPORT) return;
  }
  platform_free_operation(operation);
}

}  // namespace keymaster::adapter
