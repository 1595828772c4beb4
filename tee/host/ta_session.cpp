// A session of a client with an instance.
#include "tee/host/ta_session.h"

#include <utility>

#include "tee/core/log.h"

namespace tee {

namespace {

// A forked process has its parent's instances before its eyes, keys and all, and no part in them.
call_result report_fork() {
  log_line(TEE_TRACE_ERROR, "the device was opened before this process was forked");
  return {TEE_ERROR_BAD_STATE, TEE_ORIGIN_TEE};
}

}  // namespace

call_result ta_session::open(ta_host& host, const TEE_UUID& destination, const TEE_Identity& client,
                             call_parameters* parameters, std::shared_ptr<session>* opened) {
  auto made = std::make_shared<ta_session>(client);
  for (;;) {
    std::shared_ptr<ta_instance> target;
    if (TEE_Result res = host.instance_of(destination, &target)) return {res, TEE_ORIGIN_TEE};
    if (!target->core().dev().in_own_process()) return report_fork();
    ta_instance::visit visit(*target, &client, parameters->asked);
    if (!visit.inside()) return visit.refusal();
    // It ended while this client waited: the next instance, then.
    if (target->progress() > ta_instance::stage::CREATED) continue;

    const call_result result = target->open_session(parameters, &made->context_);
    if (result.code == TEE_SUCCESS) {
      made->target_ = target;
      *opened = std::move(made);
    }
    return result;
  }
}

call_result ta_session::invoke(uint32_t command, call_parameters* parameters) {
  const std::shared_ptr<ta_instance> callee = target();
  if (!callee) return {TEE_ERROR_TARGET_DEAD, TEE_ORIGIN_TEE};
  if (!callee->core().dev().in_own_process()) return report_fork();
  ta_instance::visit visit(*callee, &client_, parameters->asked);
  if (!visit.inside()) return visit.refusal();
  return callee->invoke(context_, command, parameters);
}

bool ta_session::is_with(const instance& target) const {
  const std::shared_ptr<ta_instance> with = this->target();
  return with && &with->core() == &target;
}

std::shared_ptr<ta_instance> ta_session::target() const {
  std::lock_guard lock(mutex_);
  return target_;
}

void ta_session::end() {
  std::unique_lock lock(mutex_);
  const std::shared_ptr<ta_instance> target = std::exchange(target_, nullptr);
  lock.unlock();
  if (target && target->core().dev().in_own_process()) {
    target->close_session(context_, client_);
  }
}

}  // namespace tee
