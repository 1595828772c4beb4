// The client API of the TEE in the process, as one table.
#include "tee/client/in_process.h"

namespace {

constexpr tee::client_api IN_PROCESS = {
    .initialize_context = tee::in_process::initialize_context,
    .finalize_context = tee::in_process::finalize_context,
    .register_shared_memory = tee::in_process::register_shared_memory,
    .allocate_shared_memory = tee::in_process::allocate_shared_memory,
    .release_shared_memory = tee::in_process::release_shared_memory,
    .open_session = tee::in_process::open_session,
    .close_session = tee::in_process::close_session,
    .invoke_command = tee::in_process::invoke_command,
    .request_cancellation = tee::in_process::request_cancellation,
};

}  // namespace

const tee::client_api* tee_client_api_in_process() {
  return &IN_PROCESS;
}
