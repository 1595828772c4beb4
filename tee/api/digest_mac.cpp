// Message digests and MACs.
#include "tee_internal_api.h"

#include "tee/api/arguments.h"
#include "tee/api/operations.h"
#include "tee/core/faults.h"

using tee::fault_point;
using tee::guarded;
using tee::input_bytes;
using tee::operation;
using tee::crypto::family;

namespace {

// The last part of a message, and its digest or MAC. Nothing is absorbed before there is room.
template <typename Engine>
TEE_Result finish(Engine& engine, std::span<const uint8_t> last, tee::output_buffer output) {
  if (TEE_Result fault = fault_point()) return fault;
  if (TEE_Result res = output.reserve(engine.length())) return res;
  if (!last.empty()) engine.update(last);
  engine.finish(output.data());
  output.set_length(engine.length());
  return TEE_SUCCESS;
}

}  // namespace

void TEE_DigestUpdate(TEE_OperationHandle operation, const void* chunk, size_t chunkSize) {
  constexpr const char* CALL = "TEE_DigestUpdate";
  guarded(CALL, [&] {
    auto& op = tee::operation_of(CALL, operation, family::DIGEST);
    std::get<tee::crypto::digest>(op.engine).update(input_bytes(CALL, "chunk", chunk, chunkSize));
  });
}

TEE_Result TEE_DigestDoFinal(TEE_OperationHandle operation, const void* chunk, size_t chunkLen,
                             void* hash, size_t* hashLen) {
  constexpr const char* CALL = "TEE_DigestDoFinal";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::operation_of(CALL, operation, family::DIGEST);
    auto last = input_bytes(CALL, "chunk", chunk, chunkLen);
    tee::output_buffer output(CALL, "hash", hash, hashLen);
    return finish(std::get<tee::crypto::digest>(op.engine), last, output);
  });
}

void TEE_MACInit(TEE_OperationHandle operation, const void* IV, size_t IVLen) {
  constexpr const char* CALL = "TEE_MACInit";
  guarded(CALL, [&] {
    auto& op = tee::keyed_operation_of(CALL, operation, family::MAC);
    input_bytes(CALL, "IV", IV, IVLen);  // HMAC has none and ignores it
    std::get<tee::crypto::hmac>(op.engine).start();
    op.state = operation::progress::INITIALIZED;
  });
}

void TEE_MACUpdate(TEE_OperationHandle operation, const void* chunk, size_t chunkSize) {
  constexpr const char* CALL = "TEE_MACUpdate";
  guarded(CALL, [&] {
    auto& op = tee::running_operation_of(CALL, operation, family::MAC);
    std::get<tee::crypto::hmac>(op.engine).update(input_bytes(CALL, "chunk", chunk, chunkSize));
  });
}

TEE_Result TEE_MACComputeFinal(TEE_OperationHandle operation, const void* message,
                               size_t messageLen, void* mac, size_t* macLen) {
  constexpr const char* CALL = "TEE_MACComputeFinal";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::MAC);
    auto last = input_bytes(CALL, "message", message, messageLen);
    tee::output_buffer output(CALL, "mac", mac, macLen);
    if (TEE_Result res = finish(std::get<tee::crypto::hmac>(op.engine), last, output)) return res;
    op.state = tee::operation::progress::INITIAL;
    return TEE_SUCCESS;
  });
}
