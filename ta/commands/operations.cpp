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

// Reads the parameters of an update or finish and authorises it. Both results. Bad parameters are a
// Keymaster error here, unlike in begin: intended.
TEE_Result authorize_step(byte_view marshalled, const live_operation& operation,
                          keymaster_key_param_set_t* params, keymaster_error_t* km_error) {
  if (unmarshal(marshalled, params) != TEE_SUCCESS) {
    trace_error("Unmarshal failed");
    *km_error = KM_ERROR_INVALID_ARGUMENT;
    return TEE_SUCCESS;
  }
  const uint64_t challenge = operation.handle();
  const TEE_Result res = authorize_update_or_finish(*params, operation.get()->key_characteristics,
                                                    challenge, km_error);
  if (failed(res, *km_error)) trace_error("Authorization failed");
  return res;
}

// Runs the object's finish. Both results.
TEE_Result run_finish(operation_t* operation, const keymaster_key_param_set_t& params,
                      byte_view input, heap_buffer* output, keymaster_key_param_set_t* out_params,
                      keymaster_error_t* km_error) {
  if (operation->finish == nullptr) {
    trace_error("Finish not implemented");
    *km_error = KM_ERROR_UNIMPLEMENTED;
    return TEE_SUCCESS;
  }
  const TEE_Result res = operation->finish(operation, params, input, output, out_params, km_error);
  if (failed(res, *km_error)) trace_error("Finish failed");
  return res;
}

// Writes output field and output parameters field; *total receives the bytes of both.
TEE_Result write_finished(byte_view result, const keymaster_key_param_set_t& out_params,
                          byte_span output, size_t* total) {
  output_cursor out(output);
  byte_span params_length;
  if (!out.write_field(result) || !out.reserve(sizeof(uint32_t), &params_length)) {
    trace_error("Too short buffer");
    return TEE_ERROR_GENERIC;
  }
  size_t size = 0;
  if (TEE_Result res = write_set(out_params, out.rest(), &size)) {
    trace_error("Marshal failed");
    return res;
  }
  store_u32(params_length, static_cast<uint32_t>(size));
  *total = out.written() + size;
  return TEE_SUCCESS;
}

}  // namespace

TEE_Result update(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  live_operation operation(io->argument);
  if (operation.get() == nullptr) {
    *km_error = KM_ERROR_INVALID_OPERATION_HANDLE;
    return TEE_SUCCESS;
  }
  input_cursor in(io->input);
  byte_view input;
  byte_view marshalled;
  if (!in.read_field(&input)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  io->result = static_cast<uint32_t>(input.size());
  if (!in.read_field(&marshalled)) return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  keymaster_key_param_set_t params;
  TEE_Result res = authorize_step(marshalled, operation, &params, km_error);
  if (failed(res, *km_error)) return res;
  operation_t* object = operation.get();
  if (object->update == nullptr) {
    return KM_FAIL(km_error, KM_ERROR_UNIMPLEMENTED, "Update not implemented");
  }
  size_t consumed = 0;
  res = object->update(object, params, input, &consumed, io->output, &io->output_size, km_error);
  io->result = static_cast<uint32_t>(consumed);
  if (failed(res, *km_error)) {
    TRACE_ERROR("Update failed");
    return res;
  }
  operation.keep();
  return TEE_SUCCESS;
}

TEE_Result finish(command_io* io, keymaster_error_t* km_error) {
  const trace_scope scope;
  live_operation operation(io->argument);
  if (operation.get() == nullptr) {
    *km_error = KM_ERROR_INVALID_OPERATION_HANDLE;
    return TEE_SUCCESS;
  }
  input_cursor in(io->input);
  byte_view input;
  byte_view marshalled;
  if (!in.read_field(&input) || !in.read_field(&marshalled)) {
    return TEE_FAIL(TEE_ERROR_GENERIC, "Too short input");
  }
  keymaster_key_param_set_t params;
  TEE_Result res = authorize_step(marshalled, operation, &params, km_error);
  if (failed(res, *km_error)) return res;
  heap_buffer output;
  keymaster_key_param_set_t out_params;
  res = run_finish(operation.get(), params, input, &output, &out_params, km_error);
  if (failed(res, *km_error)) return res;
  operation.end();  // before anything is written: a short output does not keep it alive
  return write_finished(output.view(), out_params, io->output, &io->output_size);
}

TEE_Result _abort(command_io* io, keymaster_error_t* km_error) {
  const live_operation operation(io->argument);
  if (operation.get() == nullptr) *km_error = KM_ERROR_INVALID_OPERATION_HANDLE;
  return TEE_SUCCESS;
}

}  // namespace commands
}  // namespace keymaster
