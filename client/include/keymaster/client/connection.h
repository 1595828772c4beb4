// Contexts and sessions of the TEE Client API (GlobalPlatform TEE Client API 1.0) as owners.
#pragma once

#include "tee_client_api.h"

#include <array>
#include <memory>
#include <string>

#include "keymaster/client/status.h"

namespace keymaster::client {

// The four parameter slots of a command. Outputs come back in them.
using parameter_slots = std::array<TEEC_Parameter, 4>;

// context: a device that this process talks to; copies share it, and it is closed with the last.
class context {
 public:
  // Opens the device in `folder`; empty means the default one. Throws open_error.
  explicit context(const std::string& folder = "");

  TEEC_Context* get() const { return context_.get(); }

 private:
  std::shared_ptr<TEEC_Context> context_;
};

// connection: a session with one trusted application. One call at a time.
class connection {
 public:
  // Throws open_error.
  connection(context tee, const TEEC_UUID& application);
  connection(const connection&) = delete;
  connection& operator=(const connection&) = delete;
  ~connection();

  // invoke: sends `command` with the parameter types word `types` (TEEC_PARAM_TYPES) and the slots.
  // The result has no Keymaster error: what a command's values mean is its own affair.
  status invoke(uint32_t command, uint32_t types, parameter_slots* slots);

 private:
  context tee_;
  TEEC_Session session_{};
};

}  // namespace keymaster::client
