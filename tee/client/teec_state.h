// What stands behind the `imp` members of the client API's structures when the TEE is in the
// process.
#pragma once

#include "tee_client_api.h"

#include <exception>
#include <memory>
#include <new>

#include "tee/core/session.h"
#include "tee/device/secret_bytes.h"
#include "tee/teec/imp_table.h"
#include "tee/teec/operation.h"

namespace tee {

struct client_context {
  std::shared_ptr<session_opener> host;
};

struct client_session {
  const void* context;  // imp of its context
  std::shared_ptr<session_opener> host;
  std::shared_ptr<tee::session> session;  // goes before the host
};

// Shared memory: the client's own, or from here.
struct client_memory : shared_region {
  secret_bytes own;  // empty for the client's own
};

// The tables of the process. Never destroyed: a program may end its contexts as late as it likes,
// and one that never does ends without running trusted code.
imp_table<client_context, way::IN_PROCESS>& contexts();
imp_table<client_session, way::IN_PROCESS>& client_sessions();
imp_table<client_memory, way::IN_PROCESS>& client_memories();

// client_call: runs the body of an API function that gives a result; what it throws becomes
// TEEC_ERROR_OUT_OF_MEMORY or, traced, TEEC_ERROR_GENERIC.
TEEC_Result trace_failure(const char* what) noexcept;

template <typename Body>
TEEC_Result client_call(Body body) noexcept {
  try {
    return body();
  } catch (const std::bad_alloc&) {
    return TEEC_ERROR_OUT_OF_MEMORY;
  } catch (const std::exception& error) {
    return trace_failure(error.what());
  }
}

}  // namespace tee
