// A session of a client with an instance.
#include "tee/runtime/ta_session.h"

#include <utility>

#include "tee/runtime/log.h"

namespace tee {

namespace {

TEE_Result report_cycle(ta_instance& target) {
  log_line(TEE_TRACE_ERROR, "trusted application %s waits for its caller: busy",
           to_text(target.core().uuid()).c_str());
  return TEE_ERROR_BUSY;
}

// Runs the create entry point when it has not run; an instance that fails it is forgotten.
TEE_Result create_if_new(ta_host& host, const std::shared_ptr<ta_instance>& target) {
  if (target->progress() != ta_instance::stage::LOADED) return TEE_SUCCESS;
  TEE_Result res = target->create();
  if (res != TEE_SUCCESS) host.drop(target);
  return res;
}

}  // namespace

TEE_Result ta_session::open(ta_host& host, const TEE_UUID& destination, const TEE_Identity& client,
                            uint32_t types, TEE_Param* params, std::shared_ptr<ta_session>* session,
                            uint32_t* origin) {
  *origin = TEE_ORIGIN_TEE;
  for (;;) {
    std::shared_ptr<ta_instance> target;
    if (TEE_Result res = host.instance_of(destination, &target)) return res;
    auto made = std::make_shared<ta_session>(target, client);
    ta_instance::visit visit(*target, &client);
    if (!visit.inside()) return report_cycle(*target);
    // Another client's try to create it failed while this one waited: the next instance, then.
    if (target->progress() == ta_instance::stage::FAILED) continue;

    *origin = TEE_ORIGIN_TRUSTED_APP;
    if (TEE_Result res = create_if_new(host, target)) return res;
    if (TEE_Result res = target->open_session(types, params, &made->context_)) return res;
    made->open_ = true;
    *session = std::move(made);
    return TEE_SUCCESS;
  }
}

TEE_Result ta_session::invoke(uint32_t command, uint32_t types, TEE_Param* params,
                              uint32_t* origin) {
  *origin = TEE_ORIGIN_TEE;
  if (!target_) return TEE_ERROR_TARGET_DEAD;
  ta_instance::visit visit(*target_, &client_);
  if (!visit.inside()) return report_cycle(*target_);
  *origin = TEE_ORIGIN_TRUSTED_APP;
  return target_->invoke(context_, command, types, params);
}

void ta_session::end() {
  std::shared_ptr<ta_instance> target = std::move(target_);
  if (target && open_) target->close_session(context_, client_);
}

}  // namespace tee
