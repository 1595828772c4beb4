// A session of a client, from the normal world or a trusted application, with an instance.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <memory>
#include <mutex>
#include <utility>

#include "tee/core/session.h"
#include "tee/host/ta_host.h"

namespace tee {

class ta_session final : public session {
 public:
  // open: as session_opener::open_session, for the instances of `host`.
  static call_result open(ta_host& host, const TEE_UUID& destination, const TEE_Identity& client,
                          call_parameters* parameters, std::shared_ptr<session>* opened);

  // What open makes its results with.
  explicit ta_session(const TEE_Identity& client) : client_(client) {}
  ~ta_session() override { end(); }

  call_result invoke(uint32_t command, call_parameters* parameters) override;
  void close() override { end(); }
  bool is_with(const instance& target) const override;

 private:
  std::shared_ptr<ta_instance> target() const;
  void end();

  const TEE_Identity client_;
  mutable std::mutex mutex_;
  std::shared_ptr<ta_instance> target_;  // while it is open
  void* context_ = nullptr;
};

}  // namespace tee
