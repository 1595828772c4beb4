// A client of the normal world: one context, one session at a time, in C++ terms.
#pragma once

#include "tee_client_api.h"
#include "tee_internal_api.h"

#include <cstring>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string>

#include "tee/controls/host_control.h"
#include "tests/tee/temp_device.h"

namespace tee::test {

inline TEEC_UUID to_client(const TEE_UUID& uuid) {
  TEEC_UUID same{};
  static_assert(sizeof(same) == sizeof(uuid));
  memcpy(&same, &uuid, sizeof(same));
  return same;
}

class client {
 public:
  client(const std::string& device_path, const TEE_UUID& ta) {
    setenv("TEE_TA_PATH", TEST_TA_PATH, 1);
    EXPECT_EQ(TEEC_InitializeContext(device_path.c_str(), &context), TEEC_SUCCESS);
    EXPECT_EQ(open_session(ta), TEEC_SUCCESS);
  }
  client(const client&) = delete;
  client& operator=(const client&) = delete;
  ~client() { close_context(); }

  // open_session: ends the session that is open.
  TEEC_Result open_session(const TEE_UUID& ta, TEEC_Operation* operation = nullptr,
                           uint32_t method = TEEC_LOGIN_PUBLIC, const void* data = nullptr) {
    close_session();
    TEEC_UUID uuid = to_client(ta);
    return TEEC_OpenSession(&context, &session, &uuid, method, data, operation, &origin);
  }
  TEEC_Result invoke(uint32_t command, TEEC_Operation* operation) {
    return TEEC_InvokeCommand(&session, command, operation, &origin);
  }
  void close_session() { TEEC_CloseSession(&session); }
  void close_context() {
    close_session();
    TEEC_FinalizeContext(&context);
  }

  TEEC_Context context{};
  TEEC_Session session{};
  uint32_t origin = 0;  // of the last result
};

}  // namespace tee::test
