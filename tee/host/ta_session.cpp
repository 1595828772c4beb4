// A session of a client with an instance.
#include "tee/host/ta_session.h"

#include <utility>

#include "tee/core/log.h"

namespace tee {

namespace {

call_result report_cycle(ta_instance& target) {
  log_line(TEE_TRACE_ERROR, "trusted application %s waits for its caller: busy",
           to_text(target.core().uuid()).c_str());
  return {TEE_ERROR_BUSY, TEE_ORIGIN_TEE};
}

// A forked process has its parent's instances before its eyes, keys and all, and no part in them.
call_result report_fork() {
  log_line(TEE_TRACE_ERROR, "the device was opened before this process was forked");
  return {TEE_ERROR_BAD_STATE, TEE_ORIGIN_TEE};
}

// Runs the create entry point when it has not run; an instance that fails it is forgotten.
TEE_Result create_if_new(ta_host& host, const std::shared_ptr<ta_instance>& target) {
  if (target->progress() != ta_instance::stage::LOADED) return TEE_SUCCESS;
  TEE_Result res = target->create();
  if (res != TEE_SUCCESS) host.drop(target);
  return res;
}

}  // namespace

call_result ta_session::open(ta_host& host, const TEE_UUID& destination, const TEE_Identity& client,
                             call_parameters* parameters, std::shared_ptr<session>* opened) {
  for (;;) {
    std::shared_ptr<ta_instance> target;
    if (TEE_Result res = host.instance_of(destination, &target)) return {res, TEE_ORIGIN_TEE};
    if (!target->core().dev().in_own_process()) return report_fork();
    auto made = std::make_shared<ta_session>(target, client);
    ta_instance::visit visit(*target, &client);
    if (!visit.inside()) return report_cycle(*target);
    // Another client's try to create it failed while this one waited: the next instance, then.
    if (target->progress() == ta_instance::stage::FAILED) continue;

    TEE_Result res = create_if_new(host, target);
    if (res == TEE_SUCCESS) res = target->open_session(parameters, &made->context_);
    if (res == TEE_SUCCESS) {
      made->open_ = true;
      *opened = std::move(made);
    }
    return {res, TEE_ORIGIN_TRUSTED_APP};
  }
}

call_result ta_session::invoke(uint32_t command, call_parameters* parameters) {
  if (!target_) return {TEE_ERROR_TARGET_DEAD, TEE_ORIGIN_TEE};
  if (!target_->core().dev().in_own_process()) return report_fork();
  ta_instance::visit visit(*target_, &client_);
  if (!visit.inside()) return report_cycle(*target_);
  return {target_->invoke(context_, command, parameters), TEE_ORIGIN_TRUSTED_APP};
}

bool ta_session::is_with(const instance& target) const {
  return target_ && &target_->core() == &target;
}

void ta_session::end() {
  std::shared_ptr<ta_instance> target = std::move(target_);
  if (target && open_ && target->core().dev().in_own_process())
    target->close_session(context_, client_);
}

}  // namespace tee
