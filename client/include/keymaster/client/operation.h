// An operation from begin to its end.
#pragma once

#include "keymaster/client/session.h"

namespace keymaster::client {

// operation: owns the handle of a begun operation. Destroyed before its end, it aborts it; the
// session must outlive it.
class operation {
 public:
  // `begun` is what session::begin returned; one that failed makes an operation that is not live.
  operation(session* keymaster, const begin_result& begun);
  operation(const operation&) = delete;
  operation& operator=(const operation&) = delete;
  ~operation();

  bool live() const { return live_; }
  uint32_t handle() const { return handle_; }

  // update: feeds all of `input`, in as many commands as the TA wants, and appends what comes out
  // to `output`. A failure ends the operation. An operation that is not live answers
  // KM_ERROR_INVALID_OPERATION_HANDLE.
  status update(byte_view input, bytes* output, const param_set& params = {});

  // finish: ends the operation; see session::finish.
  finish_result finish(byte_view signature = {}, const param_set& params = {}, size_t room = 0);

 private:
  session* keymaster_;
  uint32_t handle_;
  bool live_;
};

}  // namespace keymaster::client
