// Block ciphers without padding.
#include "tee_internal_api.h"

#include "tee/api/arguments.h"
#include "tee/api/operations.h"
#include "tee/core/faults.h"

using tee::fault_point;
using tee::guarded;
using tee::input_bytes;
using tee::panic;
using tee::crypto::block_cipher;
using tee::crypto::family;

namespace {

// Puts `input` through the cipher once there is room for all that it will give. An input that
// shares memory with the output is read in place only where a byte is never written before it was
// read: in the very same place with no incomplete block held.
TEE_Result run(const char* call, block_cipher* engine, std::span<const uint8_t> input,
               tee::output_buffer output) {
  size_t length = engine->output_size(input.size());
  if (TEE_Result res = output.reserve(length)) return res;
  tee::require_apart(call, input, output.data(), length, tee::same_place::ALLOWED);
  tee::steady_input steady(input, output.data(), length, engine->held() == 0);
  engine->update(steady.bytes(), output.data());
  output.set_length(length);
  return TEE_SUCCESS;
}

}  // namespace

void TEE_CipherInit(TEE_OperationHandle operation, const void* IV, size_t IVLen) {
  constexpr const char* CALL = "TEE_CipherInit";
  guarded(CALL, [&] {
    auto& op = tee::keyed_operation_of(CALL, operation, family::CIPHER);
    auto& engine = std::get<block_cipher>(op.engine);
    auto iv = input_bytes(CALL, "IV", IV, IVLen);
    if (iv.size() != engine.iv_length()) {
      panic(CALL, "IV of %zu bytes where %zu are needed", iv.size(), engine.iv_length());
    }
    engine.start(iv);
    op.state = tee::operation::progress::INITIALIZED;
  });
}

TEE_Result TEE_CipherUpdate(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                            void* destData, size_t* destLen) {
  constexpr const char* CALL = "TEE_CipherUpdate";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::CIPHER);
    auto input = input_bytes(CALL, "srcData", srcData, srcLen);
    tee::output_buffer output(CALL, "destData", destData, destLen);
    if (TEE_Result fault = fault_point()) return fault;
    return run(CALL, &std::get<block_cipher>(op.engine), input, output);
  });
}

TEE_Result TEE_CipherDoFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                             void* destData, size_t* destLen) {
  constexpr const char* CALL = "TEE_CipherDoFinal";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::CIPHER);
    auto& engine = std::get<block_cipher>(op.engine);
    auto input = input_bytes(CALL, "srcData", srcData, srcLen);
    tee::output_buffer output(CALL, "destData", destData, destLen);
    if (engine.output_size(input.size()) != engine.held() + input.size()) {
      panic(CALL, "the message ends inside a block");
    }
    if (TEE_Result fault = fault_point()) return fault;
    if (TEE_Result res = run(CALL, &engine, input, output)) return res;
    op.state = tee::operation::progress::INITIAL;
    return TEE_SUCCESS;
  });
}
