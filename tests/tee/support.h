// API calls without a trusted application: a test fixture that is an instance, with an own device.
#pragma once

#include "tee_extensions.h"
#include "tee_internal_api.h"

#include <gtest/gtest.h>
#include <memory>
#include <vector>

#include "tee/core/instance.h"
#include "tee/device/device.h"

namespace tee::test {

using bytes = std::vector<uint8_t>;

// shared_device: one device for the whole test program, in a temporary folder.
device& shared_device();

// A test whose body runs inside an instance.
class in_instance : public ::testing::Test {
 protected:
  static constexpr size_t HEAP_LIMIT = 64 * 1024;
  static constexpr TEE_UUID UUID = {0x01020304, 0x0506, 0x0708, {9, 10, 11, 12, 13, 14, 15, 16}};

  instance ta_{UUID, shared_device(), HEAP_LIMIT};
  instance_scope scope_{ta_};
};

// ref: an attribute that borrows its bytes.
TEE_Attribute ref(uint32_t id, const bytes& value);

// secret_key: an object that holds a symmetric key.
TEE_ObjectHandle secret_key(uint32_t type, const bytes& secret);

// operation: one with that key, which may be null. The object is freed.
TEE_OperationHandle operation(uint32_t algorithm, uint32_t mode, uint32_t bits,
                              TEE_ObjectHandle key);

}  // namespace tee::test
