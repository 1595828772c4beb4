// GlobalPlatform TEE Internal Core API, version 1.3 prototypes (size_t lengths, const inputs): the
// subset that a Keymaster-class trusted application uses. Published names only; a product builds
// against its own TEE's header of the same name.
#pragma once

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef uint32_t TEE_Result;

#define TEE_SUCCESS 0x00000000
#define TEE_ERROR_CORRUPT_OBJECT 0xF0100001
#define TEE_ERROR_CORRUPT_OBJECT_2 0xF0100002
#define TEE_ERROR_STORAGE_NOT_AVAILABLE 0xF0100003
#define TEE_ERROR_STORAGE_NOT_AVAILABLE_2 0xF0100004
#define TEE_ERROR_CIPHERTEXT_INVALID 0xF0100006
#define TEE_ERROR_GENERIC 0xFFFF0000
#define TEE_ERROR_ACCESS_DENIED 0xFFFF0001
#define TEE_ERROR_CANCEL 0xFFFF0002
#define TEE_ERROR_ACCESS_CONFLICT 0xFFFF0003
#define TEE_ERROR_EXCESS_DATA 0xFFFF0004
#define TEE_ERROR_BAD_FORMAT 0xFFFF0005
#define TEE_ERROR_BAD_PARAMETERS 0xFFFF0006
#define TEE_ERROR_BAD_STATE 0xFFFF0007
#define TEE_ERROR_ITEM_NOT_FOUND 0xFFFF0008
#define TEE_ERROR_NOT_IMPLEMENTED 0xFFFF0009
#define TEE_ERROR_NOT_SUPPORTED 0xFFFF000A
#define TEE_ERROR_NO_DATA 0xFFFF000B
#define TEE_ERROR_OUT_OF_MEMORY 0xFFFF000C
#define TEE_ERROR_BUSY 0xFFFF000D
#define TEE_ERROR_COMMUNICATION 0xFFFF000E
#define TEE_ERROR_SECURITY 0xFFFF000F
#define TEE_ERROR_SHORT_BUFFER 0xFFFF0010
#define TEE_ERROR_EXTERNAL_CANCEL 0xFFFF0011
#define TEE_ERROR_TIMEOUT 0xFFFF3001
#define TEE_ERROR_OVERFLOW 0xFFFF300F
#define TEE_ERROR_TARGET_DEAD 0xFFFF3024
#define TEE_ERROR_STORAGE_NO_SPACE 0xFFFF3041
#define TEE_ERROR_MAC_INVALID 0xFFFF3071
#define TEE_ERROR_SIGNATURE_INVALID 0xFFFF3072
#define TEE_ERROR_TIME_NOT_SET 0xFFFF5000

// Basic types.

typedef struct {
  uint32_t timeLow;
  uint16_t timeMid;
  uint16_t timeHiAndVersion;
  uint8_t clockSeqAndNode[8];
} TEE_UUID;

typedef struct {
  uint32_t login;
  TEE_UUID uuid;
} TEE_Identity;

typedef union {
  struct {
    void* buffer;
    size_t size;
  } memref;
  struct {
    uint32_t a;
    uint32_t b;
  } value;
} TEE_Param;

typedef struct {
  uint32_t attributeID;
  union {
    struct {
      void* buffer;
      size_t length;
    } ref;
    struct {
      uint32_t a;
      uint32_t b;
    } value;
  } content;
} TEE_Attribute;

typedef struct {
  uint32_t objectType;
  uint32_t objectSize;     // bits; 0 while uninitialised
  uint32_t maxObjectSize;  // bits
  uint32_t objectUsage;
  size_t dataSize;      // bytes; persistent objects only
  size_t dataPosition;  // bytes; persistent objects only
  uint32_t handleFlags;
} TEE_ObjectInfo;

typedef struct {
  uint32_t seconds;
  uint32_t millis;
} TEE_Time;

typedef enum { TEE_DATA_SEEK_SET = 0, TEE_DATA_SEEK_CUR = 1, TEE_DATA_SEEK_END = 2 } TEE_Whence;

typedef struct __TEE_TASessionHandle* TEE_TASessionHandle;
typedef struct __TEE_PropSetHandle* TEE_PropSetHandle;
typedef struct __TEE_ObjectHandle* TEE_ObjectHandle;
typedef struct __TEE_OperationHandle* TEE_OperationHandle;

#define TEE_HANDLE_NULL 0
#define TEE_TIMEOUT_INFINITE 0xFFFFFFFF

// Parameters of an entry point: four nibbles, slot 0 lowest.

#define TEE_PARAM_TYPE_NONE 0
#define TEE_PARAM_TYPE_VALUE_INPUT 1
#define TEE_PARAM_TYPE_VALUE_OUTPUT 2
#define TEE_PARAM_TYPE_VALUE_INOUT 3
#define TEE_PARAM_TYPE_MEMREF_INPUT 5
#define TEE_PARAM_TYPE_MEMREF_OUTPUT 6
#define TEE_PARAM_TYPE_MEMREF_INOUT 7
#define TEE_PARAM_TYPES(t0, t1, t2, t3) \
  ((uint32_t)(t0) | ((uint32_t)(t1) << 4) | ((uint32_t)(t2) << 8) | ((uint32_t)(t3) << 12))
#define TEE_PARAM_TYPE_GET(t, i) ((((uint32_t)(t)) >> ((i)*4)) & 0xF)

#define TEE_ORIGIN_API 1
#define TEE_ORIGIN_COMMS 2
#define TEE_ORIGIN_TEE 3
#define TEE_ORIGIN_TRUSTED_APP 4

#define TEE_LOGIN_PUBLIC 0x00000000
#define TEE_LOGIN_USER 0x00000001
#define TEE_LOGIN_GROUP 0x00000002
#define TEE_LOGIN_APPLICATION 0x00000004
#define TEE_LOGIN_APPLICATION_USER 0x00000005
#define TEE_LOGIN_APPLICATION_GROUP 0x00000006
#define TEE_LOGIN_TRUSTED_APP 0xF0000000

// Entry points, defined by the trusted application.

#define TA_EXPORT __attribute__((visibility("default")))

TEE_Result TA_EXPORT TA_CreateEntryPoint(void);
void TA_EXPORT TA_DestroyEntryPoint(void);
TEE_Result TA_EXPORT TA_OpenSessionEntryPoint(uint32_t paramTypes, TEE_Param params[4],
                                              void** sessionContext);
void TA_EXPORT TA_CloseSessionEntryPoint(void* sessionContext);
TEE_Result TA_EXPORT TA_InvokeCommandEntryPoint(void* sessionContext, uint32_t commandID,
                                                uint32_t paramTypes, TEE_Param params[4]);

// Panic and memory.

#define TEE_MALLOC_FILL_ZERO 0x00000000
#define TEE_MALLOC_NO_FILL 0x00000001
#define TEE_MALLOC_NO_SHARE 0x00000002

void TEE_Panic(TEE_Result panicCode) __attribute__((noreturn));
void* TEE_Malloc(size_t size, uint32_t hint);
void* TEE_Realloc(void* buffer, size_t newSize);
void TEE_Free(void* buffer);

// Properties.

#define TEE_PROPSET_TEE_IMPLEMENTATION ((TEE_PropSetHandle)(uintptr_t)0xFFFFFFFD)
#define TEE_PROPSET_CURRENT_CLIENT ((TEE_PropSetHandle)(uintptr_t)0xFFFFFFFE)
#define TEE_PROPSET_CURRENT_TA ((TEE_PropSetHandle)(uintptr_t)0xFFFFFFFF)

TEE_Result TEE_GetPropertyAsString(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                   char* valueBuffer, size_t* valueBufferLen);
TEE_Result TEE_GetPropertyAsU32(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                uint32_t* value);
TEE_Result TEE_GetPropertyAsUUID(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                 TEE_UUID* value);
TEE_Result TEE_GetPropertyAsIdentity(TEE_PropSetHandle propsetOrEnumerator, const char* name,
                                     TEE_Identity* value);

// Time.

void TEE_GetSystemTime(TEE_Time* time);
void TEE_GetREETime(TEE_Time* time);
TEE_Result TEE_Wait(uint32_t timeout);

// Cancellation.

bool TEE_GetCancellationFlag(void);
bool TEE_UnmaskCancellation(void);
bool TEE_MaskCancellation(void);

// Sessions to other trusted applications.

TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t cancellationRequestTimeout,
                             uint32_t paramTypes, TEE_Param params[4], TEE_TASessionHandle* session,
                             uint32_t* returnOrigin);
void TEE_CloseTASession(TEE_TASessionHandle session);
TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle session, uint32_t cancellationRequestTimeout,
                               uint32_t commandID, uint32_t paramTypes, TEE_Param params[4],
                               uint32_t* returnOrigin);

// Objects.

#define TEE_TYPE_AES 0xA0000010
#define TEE_TYPE_HMAC_MD5 0xA0000001
#define TEE_TYPE_HMAC_SHA1 0xA0000002
#define TEE_TYPE_HMAC_SHA224 0xA0000003
#define TEE_TYPE_HMAC_SHA256 0xA0000004
#define TEE_TYPE_HMAC_SHA384 0xA0000005
#define TEE_TYPE_HMAC_SHA512 0xA0000006
#define TEE_TYPE_RSA_PUBLIC_KEY 0xA0000030
#define TEE_TYPE_RSA_KEYPAIR 0xA1000030
#define TEE_TYPE_ECDSA_PUBLIC_KEY 0xA0000041
#define TEE_TYPE_ECDSA_KEYPAIR 0xA1000041
#define TEE_TYPE_DATA 0xA00000BF

// An attribute identifier tells its kind: bit 29 set for a value, clear for a buffer; bit 28 set
// for a public attribute, readable without the extractable right.
#define TEE_ATTR_FLAG_VALUE 0x20000000
#define TEE_ATTR_FLAG_PUBLIC 0x10000000

#define TEE_ATTR_SECRET_VALUE 0xC0000000
#define TEE_ATTR_RSA_MODULUS 0xD0000130
#define TEE_ATTR_RSA_PUBLIC_EXPONENT 0xD0000230
#define TEE_ATTR_RSA_PRIVATE_EXPONENT 0xC0000330
#define TEE_ATTR_RSA_PRIME1 0xC0000430
#define TEE_ATTR_RSA_PRIME2 0xC0000530
#define TEE_ATTR_RSA_EXPONENT1 0xC0000630
#define TEE_ATTR_RSA_EXPONENT2 0xC0000730
#define TEE_ATTR_RSA_COEFFICIENT 0xC0000830
#define TEE_ATTR_RSA_OAEP_LABEL 0xD0000930
#define TEE_ATTR_RSA_OAEP_MGF_HASH 0xD0000931  // buffer: a TEE_ALG_ of a digest, 4 bytes
#define TEE_ATTR_RSA_PSS_SALT_LENGTH 0xF0000A30
#define TEE_ATTR_ECC_PUBLIC_VALUE_X 0xD0000141
#define TEE_ATTR_ECC_PUBLIC_VALUE_Y 0xD0000241
#define TEE_ATTR_ECC_PRIVATE_VALUE 0xC0000341
#define TEE_ATTR_ECC_CURVE 0xF0000441

#define TEE_ECC_CURVE_NIST_P192 0x00000001
#define TEE_ECC_CURVE_NIST_P224 0x00000002
#define TEE_ECC_CURVE_NIST_P256 0x00000003
#define TEE_ECC_CURVE_NIST_P384 0x00000004
#define TEE_ECC_CURVE_NIST_P521 0x00000005

#define TEE_USAGE_DEFAULT 0xFFFFFFFF
#define TEE_USAGE_EXTRACTABLE 0x00000001
#define TEE_USAGE_ENCRYPT 0x00000002
#define TEE_USAGE_DECRYPT 0x00000004
#define TEE_USAGE_MAC 0x00000008
#define TEE_USAGE_SIGN 0x00000010
#define TEE_USAGE_VERIFY 0x00000020
#define TEE_USAGE_DERIVE 0x00000040

#define TEE_HANDLE_FLAG_PERSISTENT 0x00010000
#define TEE_HANDLE_FLAG_INITIALIZED 0x00020000
#define TEE_HANDLE_FLAG_KEY_SET 0x00040000
#define TEE_HANDLE_FLAG_EXPECT_TWO_KEYS 0x00080000

void TEE_InitRefAttribute(TEE_Attribute* attr, uint32_t attributeID, const void* buffer,
                          size_t length);
void TEE_InitValueAttribute(TEE_Attribute* attr, uint32_t attributeID, uint32_t a, uint32_t b);
TEE_Result TEE_AllocateTransientObject(uint32_t objectType, uint32_t maxObjectSize,
                                       TEE_ObjectHandle* object);
void TEE_FreeTransientObject(TEE_ObjectHandle object);
TEE_Result TEE_PopulateTransientObject(TEE_ObjectHandle object, const TEE_Attribute* attrs,
                                       uint32_t attrCount);
TEE_Result TEE_GenerateKey(TEE_ObjectHandle object, uint32_t keySize, const TEE_Attribute* params,
                           uint32_t paramCount);
TEE_Result TEE_GetObjectBufferAttribute(TEE_ObjectHandle object, uint32_t attributeID, void* buffer,
                                        size_t* size);
TEE_Result TEE_GetObjectInfo1(TEE_ObjectHandle object, TEE_ObjectInfo* objectInfo);
void TEE_CloseObject(TEE_ObjectHandle object);

// Persistent objects.

#define TEE_STORAGE_PRIVATE 0x00000001
#define TEE_OBJECT_ID_MAX_LEN 64
#define TEE_DATA_MAX_POSITION 0xFFFFFFFF

#define TEE_DATA_FLAG_ACCESS_READ 0x00000001
#define TEE_DATA_FLAG_ACCESS_WRITE 0x00000002
#define TEE_DATA_FLAG_ACCESS_WRITE_META 0x00000004
#define TEE_DATA_FLAG_SHARE_READ 0x00000010
#define TEE_DATA_FLAG_SHARE_WRITE 0x00000020
#define TEE_DATA_FLAG_OVERWRITE 0x00000400

TEE_Result TEE_OpenPersistentObject(uint32_t storageID, const void* objectID, size_t objectIDLen,
                                    uint32_t flags, TEE_ObjectHandle* object);
TEE_Result TEE_CreatePersistentObject(uint32_t storageID, const void* objectID, size_t objectIDLen,
                                      uint32_t flags, TEE_ObjectHandle attributes,
                                      const void* initialData, size_t initialDataLen,
                                      TEE_ObjectHandle* object);
TEE_Result TEE_CloseAndDeletePersistentObject1(TEE_ObjectHandle object);
TEE_Result TEE_ReadObjectData(TEE_ObjectHandle object, void* buffer, size_t size, size_t* count);
TEE_Result TEE_WriteObjectData(TEE_ObjectHandle object, const void* buffer, size_t size);
TEE_Result TEE_SeekObjectData(TEE_ObjectHandle object, intmax_t offset, TEE_Whence whence);

// Operations.

typedef enum {
  TEE_MODE_ENCRYPT = 0,
  TEE_MODE_DECRYPT = 1,
  TEE_MODE_SIGN = 2,
  TEE_MODE_VERIFY = 3,
  TEE_MODE_MAC = 4,
  TEE_MODE_DIGEST = 5,
  TEE_MODE_DERIVE = 6
} TEE_OperationMode;

#define TEE_ALG_AES_ECB_NOPAD 0x10000010
#define TEE_ALG_AES_CBC_NOPAD 0x10000110
#define TEE_ALG_AES_CTR 0x10000210
#define TEE_ALG_AES_GCM 0x40000810
#define TEE_ALG_RSASSA_PKCS1_V1_5_MD5 0x70001830
#define TEE_ALG_RSASSA_PKCS1_V1_5_SHA1 0x70002830
#define TEE_ALG_RSASSA_PKCS1_V1_5_SHA224 0x70003830
#define TEE_ALG_RSASSA_PKCS1_V1_5_SHA256 0x70004830
#define TEE_ALG_RSASSA_PKCS1_V1_5_SHA384 0x70005830
#define TEE_ALG_RSASSA_PKCS1_V1_5_SHA512 0x70006830
#define TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1 0x70212930
#define TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224 0x70313930
#define TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256 0x70414930
#define TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384 0x70515930
#define TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512 0x70616930
#define TEE_ALG_RSAES_PKCS1_V1_5 0x60000130
#define TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1 0x60210230
#define TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA224 0x60310230
#define TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256 0x60410230
#define TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA384 0x60510230
#define TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA512 0x60610230
#define TEE_ALG_RSA_NOPAD 0x60000030
#define TEE_ALG_ECDSA_P192 0x70001041
#define TEE_ALG_ECDSA_P224 0x70002041
#define TEE_ALG_ECDSA_P256 0x70003041
#define TEE_ALG_ECDSA_P384 0x70004041
#define TEE_ALG_ECDSA_P521 0x70005041
#define TEE_ALG_ECDSA_SHA1 0x70001042
#define TEE_ALG_ECDSA_SHA224 0x70002042
#define TEE_ALG_ECDSA_SHA256 0x70003042
#define TEE_ALG_ECDSA_SHA384 0x70004042
#define TEE_ALG_ECDSA_SHA512 0x70005042
#define TEE_ALG_MD5 0x50000001
#define TEE_ALG_SHA1 0x50000002
#define TEE_ALG_SHA224 0x50000003
#define TEE_ALG_SHA256 0x50000004
#define TEE_ALG_SHA384 0x50000005
#define TEE_ALG_SHA512 0x50000006
#define TEE_ALG_HMAC_MD5 0x30000001
#define TEE_ALG_HMAC_SHA1 0x30000002
#define TEE_ALG_HMAC_SHA224 0x30000003
#define TEE_ALG_HMAC_SHA256 0x30000004
#define TEE_ALG_HMAC_SHA384 0x30000005
#define TEE_ALG_HMAC_SHA512 0x30000006

TEE_Result TEE_AllocateOperation(TEE_OperationHandle* operation, uint32_t algorithm, uint32_t mode,
                                 uint32_t maxKeySize);
void TEE_FreeOperation(TEE_OperationHandle operation);
TEE_Result TEE_SetOperationKey(TEE_OperationHandle operation, TEE_ObjectHandle key);

void TEE_DigestUpdate(TEE_OperationHandle operation, const void* chunk, size_t chunkSize);
TEE_Result TEE_DigestDoFinal(TEE_OperationHandle operation, const void* chunk, size_t chunkLen,
                             void* hash, size_t* hashLen);

void TEE_MACInit(TEE_OperationHandle operation, const void* IV, size_t IVLen);
void TEE_MACUpdate(TEE_OperationHandle operation, const void* chunk, size_t chunkSize);
TEE_Result TEE_MACComputeFinal(TEE_OperationHandle operation, const void* message,
                               size_t messageLen, void* mac, size_t* macLen);

void TEE_CipherInit(TEE_OperationHandle operation, const void* IV, size_t IVLen);
TEE_Result TEE_CipherUpdate(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                            void* destData, size_t* destLen);
TEE_Result TEE_CipherDoFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                             void* destData, size_t* destLen);

TEE_Result TEE_AEInit(TEE_OperationHandle operation, const void* nonce, size_t nonceLen,
                      uint32_t tagLen, size_t AADLen, size_t payloadLen);
void TEE_AEUpdateAAD(TEE_OperationHandle operation, const void* AADdata, size_t AADdataLen);
TEE_Result TEE_AEUpdate(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                        void* destData, size_t* destLen);
TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                              void* destData, size_t* destLen, void* tag, size_t* tagLen);
TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                              void* destData, size_t* destLen, void* tag, size_t tagLen);

TEE_Result TEE_AsymmetricEncrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                 uint32_t paramCount, const void* srcData, size_t srcLen,
                                 void* destData, size_t* destLen);
TEE_Result TEE_AsymmetricDecrypt(TEE_OperationHandle operation, const TEE_Attribute* params,
                                 uint32_t paramCount, const void* srcData, size_t srcLen,
                                 void* destData, size_t* destLen);
TEE_Result TEE_AsymmetricSignDigest(TEE_OperationHandle operation, const TEE_Attribute* params,
                                    uint32_t paramCount, const void* digest, size_t digestLen,
                                    void* signature, size_t* signatureLen);
TEE_Result TEE_AsymmetricVerifyDigest(TEE_OperationHandle operation, const TEE_Attribute* params,
                                      uint32_t paramCount, const void* digest, size_t digestLen,
                                      const void* signature, size_t signatureLen);

void TEE_GenerateRandom(void* randomBuffer, size_t randomBufferLen);

// Arithmetic. A big integer lies in memory of the application; its words are the platform's.

typedef uint32_t TEE_BigInt;

#define TEE_BigIntSizeInU32(n) ((((n) + 31) / 32) + 2)

void TEE_BigIntInit(TEE_BigInt* bigInt, size_t len);
TEE_Result TEE_BigIntConvertFromOctetString(TEE_BigInt* dest, const uint8_t* buffer,
                                            size_t bufferLen, int32_t sign);
int32_t TEE_BigIntCmp(const TEE_BigInt* op1, const TEE_BigInt* op2);
int32_t TEE_BigIntCmpS32(const TEE_BigInt* op, int32_t shortVal);
void TEE_BigIntMod(TEE_BigInt* dest, const TEE_BigInt* op, const TEE_BigInt* n);
void TEE_BigIntAddMod(TEE_BigInt* dest, const TEE_BigInt* op1, const TEE_BigInt* op2,
                      const TEE_BigInt* n);
void TEE_BigIntMulMod(TEE_BigInt* dest, const TEE_BigInt* op1, const TEE_BigInt* op2,
                      const TEE_BigInt* n);
int32_t TEE_BigIntIsProbablePrime(const TEE_BigInt* op, uint32_t confidenceLevel);

#ifdef __cplusplus
}
#endif
