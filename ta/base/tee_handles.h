// Owners of the platform's objects and operations. Each has a zero state in which every
// call that cleans up is legal. Methods trace a failure in their caller's name.
#pragma once

#include "tee_internal_api.h"

#include <utility>

#include "ta/base/bytes.h"

namespace keymaster {

// ref_attribute: a buffer attribute; `bytes` must live until the call that takes it returns.
TEE_Attribute ref_attribute(uint32_t id, byte_view bytes);
TEE_Attribute value_attribute(uint32_t id, uint32_t a, uint32_t b = 0);

// tee_object: owns a transient object (or an open persistent one: closing is the same call).
class tee_object {
 public:
  tee_object() = default;
  tee_object(tee_object&& other) noexcept : handle_(other.release()) {}
  tee_object& operator=(tee_object&& other) noexcept {
    reset(other.release());
    return *this;
  }
  ~tee_object() { reset(); }

  [[nodiscard]] TEE_Result allocate(uint32_t type, uint32_t max_bits);
  [[nodiscard]] TEE_Result populate(std::span<const TEE_Attribute> attributes);
  [[nodiscard]] TEE_Result generate(uint32_t bits, std::span<const TEE_Attribute> parameters);
  // Reads buffer attribute `id` into `buffer`; `*length` receives the bytes written.
  [[nodiscard]] TEE_Result read_attribute(uint32_t id, byte_span buffer, size_t* length) const;

  TEE_ObjectHandle get() const { return handle_; }
  // For calls that hand out a handle; whatever was owned is closed first.
  TEE_ObjectHandle* receive() {
    reset();
    return &handle_;
  }
  TEE_ObjectHandle release() { return std::exchange(handle_, TEE_ObjectHandle{}); }
  void reset(TEE_ObjectHandle handle = TEE_ObjectHandle{});
  explicit operator bool() const { return handle_ != TEE_ObjectHandle{}; }

 private:
  TEE_ObjectHandle handle_{};
};

// tee_operation: owns an operation.
class tee_operation {
 public:
  tee_operation() = default;
  tee_operation(tee_operation&& other) noexcept : handle_(other.release()) {}
  tee_operation& operator=(tee_operation&& other) noexcept {
    reset(other.release());
    return *this;
  }
  ~tee_operation() { reset(); }

  [[nodiscard]] TEE_Result allocate(uint32_t algorithm, uint32_t mode, uint32_t max_key_bits);
  [[nodiscard]] TEE_Result set_key(TEE_ObjectHandle key);
  [[nodiscard]] TEE_Result digest_final(byte_view last, byte_span digest, size_t* length);
  [[nodiscard]] TEE_Result mac_final(byte_view last, byte_span mac, size_t* length);
  [[nodiscard]] TEE_Result ae_init(byte_view nonce, uint32_t tag_bits);
  // `*produced` receives the bytes written to `output`.
  [[nodiscard]] TEE_Result ae_update(byte_view input, byte_span output, size_t* produced);

  // For calls whose message differs from place to place.
  TEE_OperationHandle get() const { return handle_; }
  TEE_OperationHandle release() { return std::exchange(handle_, TEE_OperationHandle{}); }
  void reset(TEE_OperationHandle handle = TEE_OperationHandle{});
  explicit operator bool() const { return handle_ != TEE_OperationHandle{}; }

 private:
  TEE_OperationHandle handle_{};
};

}  // namespace keymaster
