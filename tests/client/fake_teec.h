// A TEE Client API whose trusted application is a function of the test: what a client makes of any
// answer can be tried without a TEE. The test program's own TEEC_ functions stand before libteec's.
#pragma once

#include "tee_client_api.h"

#include <functional>
#include <vector>

#include "keymaster/client/bytes.h"

namespace fake_teec {

struct request {
  uint32_t command;
  uint32_t types;
  uint32_t a = 0;
  size_t capacity = 0;  // of its one output buffer
};

// What the application answers; output goes to slot 2 as far as it fits, output_size is reported.
struct answer {
  TEEC_Result result = TEEC_SUCCESS;
  int32_t a = 0;
  uint32_t b = 0;
  keymaster::client::bytes output = {};
  size_t output_size = SIZE_MAX;  // SIZE_MAX: as long as the output
  bool leave_slots = false;       // as when the TEE fails below the application
};

using handler = std::function<answer(const request&)>;

// Every request since the handler was set.
extern std::vector<request> requests;
void set_handler(handler answers);
// answer_with: the same to every request.
void answer_with(const answer& reply);

}  // namespace fake_teec
