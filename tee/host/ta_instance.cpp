// An instance of a trusted application with its code: created, entered, destroyed; or dead.
#include "tee/host/ta_instance.h"

#include <cstring>
#include <utility>

#include "tee/core/border.h"
#include "tee/core/log.h"
#include "tee/host/survival.h"
#include "tee/host/ta_host.h"

namespace tee {

namespace {

constexpr call_result DEAD = {TEE_ERROR_TARGET_DEAD, TEE_ORIGIN_TEE};

// What a trusted application that is closed or destroyed has before it counts as a runaway's, too.
constexpr uint32_t FAREWELL_MS = 10'000;

template <typename T>
T declared_or(const property_map& declared, const char* name, T otherwise) {
  auto found = declared.find(name);
  if (found == declared.end()) return otherwise;
  const T* value = std::get_if<T>(&found->second);
  return value != nullptr ? *value : otherwise;
}

instance_rules rules_of(const property_map& declared) {
  return {declared_or(declared, "gpd.ta.singleInstance", true),
          declared_or(declared, "gpd.ta.multiSession", true),
          declared_or(declared, "gpd.ta.instanceKeepAlive", true)};
}

uint32_t heap_limit_of(const property_map& declared) {
  return declared_or(declared, "gpd.ta.dataSize", DEFAULT_HEAP_LIMIT);
}

const char* text_of(int cause) {
  if (cause == LEFT_BY_PANIC) return "panic";
  if (cause == LEFT_AS_RUNAWAY) return "went on after it was asked to end";
  return strsignal(cause);
}

}  // namespace

TEE_Result ta_instance::load(const TEE_UUID& uuid, device& dev, ta_host& host,
                             std::shared_ptr<ta_instance>* made) {
  std::unique_ptr<ta_library> library;
  if (TEE_Result res = ta_library::load(uuid, &library)) return res;
  const property_map declared = library->properties();
  *made = std::make_shared<ta_instance>(uuid, dev, host, std::move(library), declared);
  return TEE_SUCCESS;
}

ta_instance::ta_instance(const TEE_UUID& uuid, device& dev, ta_host& host,
                         std::unique_ptr<ta_library> library, const property_map& declared)
    : library_(std::move(library)),
      host_(host),
      rules_(rules_of(declared)),
      core_(uuid, dev, heap_limit_of(declared), &host) {
  property_map& own = core_.properties();
  for (const auto& [name, value] : declared)
    own.insert_or_assign(name, value);
  own.insert_or_assign("gpd.ta.dataSize", heap_limit_of(declared));
  own.insert_or_assign("gpd.ta.singleInstance", rules_.single_instance);
  own.insert_or_assign("gpd.ta.multiSession", rules_.multi_session);
  own.insert_or_assign("gpd.ta.instanceKeepAlive", rules_.keep_alive);
}

ta_instance::~ta_instance() {
  visit last(*this, nullptr, nullptr);
  if (stage_ == stage::CREATED) end();
}

ta_instance::visit::visit(ta_instance& target, const TEE_Identity* client,
                          const cancellation* asked)
    : target_(target), outcome_(target.gate_.enter(asked)) {
  if (!inside()) return;
  target_.run_pending_closes();
  target_.core_.set_client(client);
}

ta_instance::visit::~visit() {
  if (!inside()) return;
  target_.core_.set_client(nullptr);
  target_.gate_.leave();
  target_.settle();
}

call_result ta_instance::visit::refusal() const {
  if (outcome_ == call_gate::outcome::CANCELLED) return {TEE_ERROR_CANCEL, TEE_ORIGIN_TEE};
  log_line(TEE_TRACE_ERROR, "trusted application %s waits for its caller: busy",
           to_text(target_.core_.uuid()).c_str());
  return {TEE_ERROR_BUSY, TEE_ORIGIN_TEE};
}

// Runs an entry point; false when the trusted application failed in it and is dead now.
template <typename Entry>
bool ta_instance::run(const call_parameters* parameters, const cancellation* asked, Entry entry) {
  core_.set_asked(asked);
  int cause = 0;
  {
    runaway_watch watch(asked);
    instance_scope running(core_, parameters);
    cause = run_trusted(entry);
  }
  core_.set_asked(nullptr);
  if (cause != 0) die(cause);
  return cause == 0;
}

call_result ta_instance::create(const cancellation* asked) {
  const TEE_Identity client = *core_.client();
  core_.set_client(nullptr);
  TEE_Result res = TEE_SUCCESS;
  if (!run(nullptr, asked, [&] { res = library_->entries().create(); })) return DEAD;
  core_.set_client(&client);
  stage_ = res == TEE_SUCCESS ? stage::CREATED : stage::GONE;
  if (stage_ == stage::GONE) host_.drop(*this);
  return {res, TEE_ORIGIN_TRUSTED_APP};
}

call_result ta_instance::open_session(call_parameters* parameters, void** context) {
  if (open_sessions_ > 0 && !rules_.multi_session) return {TEE_ERROR_BUSY, TEE_ORIGIN_TEE};
  if (stage_ == stage::LOADED) {
    if (call_result made = create(parameters->asked); made.code != TEE_SUCCESS) return made;
  }
  TEE_Result res = TEE_SUCCESS;
  if (!run(parameters, parameters->asked, [&] {
        res =
            library_->entries().open_session(parameters->types, parameters->slots.data(), context);
      })) {
    return DEAD;
  }
  if (res == TEE_SUCCESS) ++open_sessions_;
  end_if_unused();
  return {res, TEE_ORIGIN_TRUSTED_APP};
}

call_result ta_instance::invoke(void* context, uint32_t command, call_parameters* parameters) {
  if (stage_ != stage::CREATED) return DEAD;
  TEE_Result res = TEE_SUCCESS;
  if (!run(parameters, parameters->asked, [&] {
        res = library_->entries().invoke_command(context, command, parameters->types,
                                                 parameters->slots.data());
      })) {
    return DEAD;
  }
  return {res, TEE_ORIGIN_TRUSTED_APP};
}

void ta_instance::close_session(void* context, const TEE_Identity& client) {
  {
    std::lock_guard lock(pending_mutex_);
    pending_.push_back({context, client});
    any_pending_ = true;
  }
  settle();
}

// Whoever leaves after a close became pending sees it here, or the one who made it pending finds
// the gate open.
void ta_instance::settle() {
  while (any_pending_ && gate_.try_enter()) {
    run_pending_closes();
    core_.set_client(nullptr);
    gate_.leave();
  }
}

// One at a time: a close entry point may make further ones pending.
void ta_instance::run_pending_closes() {
  while (any_pending_) {
    std::unique_lock lock(pending_mutex_);
    const pending_close next = pending_.back();
    pending_.pop_back();
    any_pending_ = !pending_.empty();
    lock.unlock();
    run_close(next);
  }
}

void ta_instance::run_close(const pending_close& session) {
  if (stage_ != stage::CREATED) return;
  core_.set_client(&session.client);
  const cancellation farewell(FAREWELL_MS, nullptr);
  if (!run(nullptr, &farewell, [&] { library_->entries().close_session(session.context); })) return;
  --open_sessions_;
  end_if_unused();
}

void ta_instance::end_if_unused() {
  if (open_sessions_ == 0 && !(rules_.single_instance && rules_.keep_alive)) end();
}

void ta_instance::end() {
  core_.set_client(nullptr);
  const cancellation farewell(FAREWELL_MS, nullptr);
  if (!run(nullptr, &farewell, [&] { library_->entries().destroy(); })) return;
  stage_ = stage::GONE;
  host_.drop(*this);
}

void ta_instance::die(int cause) {
  log_line(TEE_TRACE_ERROR, "trusted application %s is dead: %s", to_text(core_.uuid()).c_str(),
           text_of(cause));
  stage_ = stage::DEAD;
  host_.drop(*this);
  core_.reclaim();
  library_.reset();
}

}  // namespace tee
