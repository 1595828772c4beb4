// One call with an operation, over the wire.
#pragma once

#include "tee_client_api.h"

#include <functional>
#include <memory>

#include "tee/remote/link.h"
#include "tee/teec/operation.h"

namespace tee::remote {

// Shared memory that a context has from here; the client's own stays its own and is copied through.
struct remote_memory : shared_region {
  std::shared_ptr<link> tie;  // none for the client's own
  wire::shared_mapping mapping;
  uint32_t number = 0;  // at the server
};

// share: makes memory known to the server; false when it is gone. The server's code goes to
// `result`.
[[nodiscard]] bool share(link& tie, const wire::shared_mapping& memory, uint32_t* number,
                         TEEC_Result* result);

struct remote_result {
  TEEC_Result code;
  uint32_t origin;
  uint32_t number;  // of the session that was opened
};

// run_call: makes a call with the operation's parameters, which it has checked: `begin` writes what
// comes before them. Outputs go back to `operation` (may be null) whatever the trusted
// application's result. TEEC_ERROR_TARGET_DEAD with origin TEEC_ORIGIN_COMMS when the server is
// gone.
remote_result run_call(link& tie, const operation_parameters& given, TEEC_Operation* operation,
                       const std::function<void(wire::writer&, uint32_t call)>& begin);

}  // namespace tee::remote
