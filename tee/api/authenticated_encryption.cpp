// Authenticated encryption.
#include "tee_internal_api.h"

#include <cstring>

#include "tee/api/arguments.h"
#include "tee/api/operations.h"
#include "tee/core/faults.h"

using tee::fault_point;
using tee::guarded;
using tee::input_bytes;
using tee::operation;
using tee::output_buffer;
using tee::panic;
using tee::crypto::aead;
using tee::crypto::family;

namespace {

// Whether `input` may come now: there is room for its output, and the message is not too long for
// the algorithm (64 GiB).
TEE_Result admit(const operation& op, std::span<const uint8_t> input, output_buffer* output) {
  if (!std::get<aead>(op.engine).takes(input.size())) return TEE_ERROR_EXCESS_DATA;
  return output->reserve(input.size());
}

// Puts `input`, which was admitted, through the cipher.
void run(const char* call, operation* op, std::span<const uint8_t> input, output_buffer output) {
  tee::require_apart(call, input, output.data(), input.size(), tee::same_place::FORBIDDEN);
  tee::steady_input steady(input, output.data(), input.size(), true);
  std::get<aead>(op->engine).update(steady.bytes(), output.data());
  output.set_length(input.size());
  if (!input.empty()) op->payload_started = true;
}

}  // namespace

TEE_Result TEE_AEInit(TEE_OperationHandle operation, const void* nonce, size_t nonceLen,
                      uint32_t tagLen, size_t /*AADLen*/, size_t /*payloadLen*/) {
  constexpr const char* CALL = "TEE_AEInit";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::keyed_operation_of(CALL, operation, family::AE);
    if (op.state != operation::progress::INITIAL) panic(CALL, "operation is initialised already");
    auto nonce_bytes = input_bytes(CALL, "nonce", nonce, nonceLen);
    if (TEE_Result fault = fault_point()) return fault;
    bool nonce_fits = !nonce_bytes.empty() && nonce_bytes.size() <= aead::MAX_NONCE;
    if (!aead::valid_tag_length(tagLen) || !nonce_fits) return TEE_ERROR_NOT_SUPPORTED;
    std::get<aead>(op.engine).start(nonce_bytes, tagLen);
    op.state = operation::progress::INITIALIZED;
    op.payload_started = false;
    return TEE_SUCCESS;
  });
}

void TEE_AEUpdateAAD(TEE_OperationHandle operation, const void* AADdata, size_t AADdataLen) {
  constexpr const char* CALL = "TEE_AEUpdateAAD";
  guarded(CALL, [&] {
    auto& op = tee::running_operation_of(CALL, operation, family::AE);
    if (op.payload_started) panic(CALL, "associated data after payload");
    std::get<aead>(op.engine).add_associated_data(
        input_bytes(CALL, "AADdata", AADdata, AADdataLen));
  });
}

TEE_Result TEE_AEUpdate(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                        void* destData, size_t* destLen) {
  constexpr const char* CALL = "TEE_AEUpdate";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::AE);
    auto input = input_bytes(CALL, "srcData", srcData, srcLen);
    output_buffer output(CALL, "destData", destData, destLen);
    if (TEE_Result fault = fault_point()) return fault;
    if (TEE_Result res = admit(op, input, &output)) return res;
    run(CALL, &op, input, output);
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                              void* destData, size_t* destLen, void* tag, size_t* tagLen) {
  constexpr const char* CALL = "TEE_AEEncryptFinal";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::AE);
    tee::require_mode(CALL, op, TEE_MODE_ENCRYPT);
    auto& engine = std::get<aead>(op.engine);
    auto input = input_bytes(CALL, "srcData", srcData, srcLen);
    output_buffer output(CALL, "destData", destData, destLen);
    output_buffer tag_output(CALL, "tag", tag, tagLen);
    if (TEE_Result fault = fault_point()) return fault;
    // Both are looked at, so that a caller with too little room for both learns both lengths.
    TEE_Result data_room = admit(op, input, &output);
    TEE_Result tag_room = tag_output.reserve(engine.tag_length());
    if (data_room || tag_room) return data_room ? data_room : tag_room;
    run(CALL, &op, input, output);
    engine.make_tag(tag_output.data());
    tag_output.set_length(engine.tag_length());
    op.state = operation::progress::INITIAL;
    return TEE_SUCCESS;
  });
}

TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle operation, const void* srcData, size_t srcLen,
                              void* destData, size_t* destLen, void* tag, size_t tagLen) {
  constexpr const char* CALL = "TEE_AEDecryptFinal";
  return guarded(CALL, [&]() -> TEE_Result {
    auto& op = tee::running_operation_of(CALL, operation, family::AE);
    tee::require_mode(CALL, op, TEE_MODE_DECRYPT);
    auto input = input_bytes(CALL, "srcData", srcData, srcLen);
    auto tag_bytes = input_bytes(CALL, "tag", tag, tagLen);
    output_buffer output(CALL, "destData", destData, destLen);
    if (TEE_Result fault = fault_point()) return fault;
    if (TEE_Result res = admit(op, input, &output)) return res;
    run(CALL, &op, input, output);
    op.state = operation::progress::INITIAL;
    if (std::get<aead>(op.engine).check_tag(tag_bytes)) return TEE_SUCCESS;
    if (!input.empty()) explicit_bzero(output.data(), input.size());
    output.set_length(0);
    return TEE_ERROR_MAC_INVALID;
  });
}
