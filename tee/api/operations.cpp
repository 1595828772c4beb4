// Operations: allocation, keys, and the checks that all calls on them share.
#include "tee/api/operations.h"

#include "tee_extensions.h"
#include "tee_internal_api.h"

#include "tee/core/faults.h"
#include "tee/core/instance.h"
#include "tee/core/object.h"
#include "tee/core/profile.h"

using tee::current_instance;
using tee::fault_point;
using tee::guarded;
using tee::operation;
using tee::panic;
using tee::crypto::algorithm;
using tee::crypto::family;

namespace tee {

operation& operation_of(const char* call, TEE_OperationHandle handle, family kind) {
  operation& found = current_instance(call).operations().get(handle, call);
  if (found.algorithm.kind != kind) {
    panic(call, "operation of algorithm 0x%08x does not take this call", found.algorithm.id);
  }
  return found;
}

operation& keyed_operation_of(const char* call, TEE_OperationHandle handle, family kind) {
  operation& found = operation_of(call, handle, kind);
  if (!found.key) panic(call, "operation has no key");
  return found;
}

operation& running_operation_of(const char* call, TEE_OperationHandle handle, family kind) {
  operation& found = keyed_operation_of(call, handle, kind);
  if (found.state != operation::progress::INITIALIZED) panic(call, "operation is not initialised");
  return found;
}

bool offers(const crypto::key_type& type, uint32_t bits) {
  constexpr uint32_t STRICT_RSA_BITS = 4096;
  const bool rsa = type.has(TEE_ATTR_RSA_MODULUS);
  return type.allows(bits) && (!rsa || bits <= STRICT_RSA_BITS || !current_profile().strict);
}

void require_mode(const char* call, const operation& op, uint32_t mode) {
  if (op.mode != mode) panic(call, "operation is of mode %u, not %u", op.mode, mode);
}

}  // namespace tee

namespace {

bool is_public(uint32_t mode) {
  return mode == TEE_MODE_ENCRYPT || mode == TEE_MODE_VERIFY || mode == TEE_MODE_EXPORT;
}

// Whether keys of up to that size go with the algorithm; 0 stands for any, to a lenient platform
// and for export.
bool size_fits(const algorithm& row, uint32_t mode, uint32_t max_bits) {
  if (row.kind == family::DIGEST || mode == TEE_MODE_EXPORT) return true;
  if (max_bits == 0 && !tee::current_profile().strict) return true;
  if (row.curve_bits != 0) return max_bits == row.curve_bits;
  return tee::offers(*tee::crypto::find_key_type(row.key_type), max_bits);
}

bool type_fits(const operation& op, uint32_t key_type) {
  if (key_type == op.algorithm.key_type) return true;
  return is_public(op.mode) && key_type == tee::crypto::public_type_of(op.algorithm.key_type);
}

bool size_fits(const operation& op, uint32_t key_bits) {
  if (op.algorithm.curve_bits != 0) return key_bits == op.algorithm.curve_bits;
  return op.max_bits == 0 || key_bits <= op.max_bits;
}

bool is_extension(uint32_t algorithm, uint32_t mode) {
  switch (algorithm) {
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA1:
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA224:
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA256:
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA384:
    case TEE_ALG_RSAES_OAEP_PLATFORM_SHA512:
      return true;
    default:
      return mode == TEE_MODE_EXPORT;
  }
}

// The rights that an operation needs of its key.
uint32_t needed_usage(const operation& op) {
  bool raw_rsa = op.algorithm.id == TEE_ALG_RSA_NOPAD;
  switch (op.mode) {
    case TEE_MODE_ENCRYPT:
      return TEE_USAGE_ENCRYPT | (raw_rsa ? TEE_USAGE_VERIFY : 0U);
    case TEE_MODE_DECRYPT:
      return TEE_USAGE_DECRYPT | (raw_rsa ? TEE_USAGE_SIGN : 0U);
    case TEE_MODE_SIGN:
      return TEE_USAGE_SIGN;
    case TEE_MODE_VERIFY:
      return TEE_USAGE_VERIFY;
    case TEE_MODE_MAC:
      return TEE_USAGE_MAC;
    default:
      return 0;
  }
}

void check_key(const char* call, const operation& op, const tee::object& source) {
  if (!source.key) panic(call, "key is not an initialised key object");
  if (!type_fits(op, source.type)) {
    panic(call, "key of type 0x%08x does not go with algorithm 0x%08x in mode %u", source.type,
          op.algorithm.id, op.mode);
  }
  if (!size_fits(op, source.key->bits())) {
    panic(call, "key of %u bits does not fit an operation of %u", source.key->bits(), op.max_bits);
  }
  uint32_t missing = needed_usage(op) & ~source.usage;
  if (missing) panic(call, "key lacks usage right 0x%x", missing);
}

void start_engine(operation* op) {
  const algorithm& row = op->algorithm;
  bool encrypt = op->mode == TEE_MODE_ENCRYPT;
  switch (row.kind) {
    case family::MAC:
      op->engine.emplace<tee::crypto::hmac>(op->key, row.digest);
      break;
    case family::CIPHER:
      op->engine.emplace<tee::crypto::block_cipher>(op->key, row.mode, encrypt);
      break;
    case family::AE:
      op->engine.emplace<tee::crypto::aead>(op->key, encrypt);
      break;
    default:
      break;
  }
}

}  // namespace

TEE_Result TEE_AllocateOperation(TEE_OperationHandle* operation, uint32_t algorithm, uint32_t mode,
                                 uint32_t maxKeySize) {
  constexpr const char* CALL = "TEE_AllocateOperation";
  return guarded(CALL, [&]() -> TEE_Result {
    tee::instance& running = current_instance(CALL);
    if (!operation) panic(CALL, "operation is null");
    *operation = TEE_HANDLE_NULL;
    if (TEE_Result fault = fault_point()) return fault;
    const auto* row = tee::crypto::find_algorithm(algorithm);
    if (!row || !row->allows(mode) || !size_fits(*row, mode, maxKeySize) ||
        (!tee::current_profile().extensions && is_extension(algorithm, mode))) {
      return TEE_ERROR_NOT_SUPPORTED;
    }
    *operation = running.operations().emplace(*row, mode, maxKeySize, &running.digests());
    return *operation ? TEE_SUCCESS : TEE_ERROR_OUT_OF_MEMORY;
  });
}

void TEE_FreeOperation(TEE_OperationHandle operation) {
  constexpr const char* CALL = "TEE_FreeOperation";
  guarded(CALL, [&] {
    if (operation) current_instance(CALL).operations().remove(operation, CALL);
  });
}

TEE_Result TEE_SetOperationKey(TEE_OperationHandle operation, TEE_ObjectHandle key) {
  constexpr const char* CALL = "TEE_SetOperationKey";
  return guarded(CALL, [&]() -> TEE_Result {
    tee::instance& running = current_instance(CALL);
    tee::operation& op = running.operations().get(operation, CALL);
    if (op.algorithm.kind == family::DIGEST) panic(CALL, "a digest takes no key");
    if (op.state != tee::operation::progress::INITIAL) panic(CALL, "operation is initialised");
    const tee::object* source = key ? &running.objects().get(key, CALL) : nullptr;
    if (source) check_key(CALL, op, *source);
    if (TEE_Result fault = fault_point()) return fault;
    op.engine.emplace<std::monostate>();
    op.key = source ? source->key : nullptr;
    if (op.key) start_engine(&op);
    return TEE_SUCCESS;
  });
}
