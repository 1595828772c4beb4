// update, finish and _abort.
#include "ta/alg/algorithm.h"
#include "ta/auth/authorization.h"
#include "ta/auth/operation_pool.h"
#include "ta/commands/command.h"
#include "ta/commands/opened_key.h"
#include "ta/commands/operation_end.h"
#include "ta/params/marshal.h"

namespace keymaster {

void free_ended(operation_t* operation) {
  operation->key_characteristics = {};
  operation->free(operation);
}

void end_operation(operation_t* operation, uint32_t handle) {
  free_ended(operation);
  operation_pool_remove(handle);
}

namespace commands {
namespace {

// live_operation: the operation that a call works on, ended when the call leaves without keep().
class live_operation {
 public:
  explicit live_operation(uint32_t handle)
      : operation_(operation_pool_get(handle)), handle_(handle) {}
  live_operation(const live_operation&) = delete;
  live_operation& operator=(const live_operation&) = delete;
  ~live_operation() { end(); }

  explicit operator bool() const { return operation_ != nullptr; }
  operation_t* operator->() const { return operation_; }
  operation_t* get() const { return operation_; }
  uint32_t handle() const { return handle_; }
  void keep() { operation_ = nullptr; }
  void end() {
    if (operation_ != nullptr) end_operation(operation_, handle_);
    operation_ = nullptr;
  }

 private:
  operation_t* operation_;
  uint32_t handle_;
};

// Reads the parameters of an update or finish and authorises it. Bad parameters are a Keymaster
// error here, unlike in begin: intended.
keymaster_error_t authorize_step(byte_view marshalled, const live_operation& operation,
                                 keymaster_key_param_set_t* params) {
  if (unmarshal(marshalled, params) != TEE_SUCCESS) {
    return refuse(KM_ERROR_INVALID_ARGUMENT, "Unmarshal failed");
  }
  const uint64_t challenge = operation.handle();
  const auto error = authorize_update_or_finish(*params, operation->key_characteristics, challenge);
  return error == KM_ERROR_OK ? error : refuse(error, "Authorization failed");
}

}  // namespace

outcome update(command_io* io) {
  const trace_scope scope;
  live_operation operation(io->argument);
  if (!operation) return KM_ERROR_INVALID_OPERATION_HANDLE;
  input_cursor in(io->input);
  byte_view input;
  byte_view marshalled;
  if (!in.read_field(&input)) return fail(TEE_ERROR_GENERIC, "Too short input");
  io->result = static_cast<uint32_t>(input.size());
  if (!in.read_field(&marshalled)) return fail(TEE_ERROR_GENERIC, "Too short input");
  keymaster_key_param_set_t params;
  TRY(authorize_step(marshalled, operation, &params));
  if (operation->update == nullptr) {
    return refuse(KM_ERROR_UNIMPLEMENTED, "Update not implemented");
  }
  update_step step{.params = params, .input = input, .output = io->output, .request = io->input};
  const outcome how = operation->update(operation.get(), &step);
  io->result = static_cast<uint32_t>(step.consumed);
  io->output_size = step.produced;
  if (failed(how)) {
    trace(TEE_TRACE_ERROR, "Update failed");
    return how;
  }
  operation.keep();
  return DONE;
}

outcome finish(command_io* io) {
  const trace_scope scope;
  live_operation operation(io->argument);
  if (!operation) return KM_ERROR_INVALID_OPERATION_HANDLE;
  input_cursor in(io->input);
  byte_view input;
  byte_view marshalled;
  if (!in.read_field(&input) || !in.read_field(&marshalled)) {
    return fail(TEE_ERROR_GENERIC, "Too short input");
  }
  keymaster_key_param_set_t params;
  TRY(authorize_step(marshalled, operation, &params));
  if (operation->finish == nullptr) {
    return refuse(KM_ERROR_UNIMPLEMENTED, "Finish not implemented");
  }
  finish_step step{.params = params, .input = input};
  if (const outcome how = operation->finish(operation.get(), &step); failed(how)) {
    trace(TEE_TRACE_ERROR, "Finish failed");
    return how;
  }
  operation.end();  // before anything is written: a short output does not keep it alive
  output_cursor out(io->output);
  if (!out.write_field(step.output.view())) return fail(TEE_ERROR_GENERIC, "Too short buffer");
  return write_last_set(step.out_params, &out, &io->output_size);
}

outcome _abort(command_io* io) {
  const live_operation operation(io->argument);
  return operation ? KM_ERROR_OK : KM_ERROR_INVALID_OPERATION_HANDLE;
}

}  // namespace commands
}  // namespace keymaster
