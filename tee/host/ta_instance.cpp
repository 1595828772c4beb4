// An instance of a trusted application with its code: created, entered, destroyed.
#include "tee/host/ta_instance.h"

#include <utility>

namespace tee {

namespace {

uint32_t heap_limit_of(const property_map& properties) {
  auto found = properties.find("gpd.ta.dataSize");
  if (found == properties.end()) return DEFAULT_HEAP_LIMIT;
  const auto* declared = std::get_if<uint32_t>(&found->second);
  return declared != nullptr ? *declared : DEFAULT_HEAP_LIMIT;
}

}  // namespace

TEE_Result ta_instance::load(const TEE_UUID& uuid, device& dev, session_opener& opener,
                             std::shared_ptr<ta_instance>* made) {
  std::unique_ptr<ta_library> library;
  if (TEE_Result res = ta_library::load(uuid, &library)) return res;
  const property_map declared = library->properties();
  *made = std::make_shared<ta_instance>(uuid, dev, opener, std::move(library), declared);
  return TEE_SUCCESS;
}

ta_instance::ta_instance(const TEE_UUID& uuid, device& dev, session_opener& opener,
                         std::unique_ptr<ta_library> library, const property_map& declared)
    : library_(std::move(library)), core_(uuid, dev, heap_limit_of(declared), &opener) {
  property_map& own = core_.properties();
  for (const auto& [name, value] : declared)
    own.insert_or_assign(name, value);
  own.insert_or_assign("gpd.ta.dataSize", heap_limit_of(declared));
  own.insert_or_assign("gpd.ta.singleInstance", true);
  own.insert_or_assign("gpd.ta.multiSession", true);
  own.insert_or_assign("gpd.ta.instanceKeepAlive", true);
}

ta_instance::~ta_instance() {
  if (stage_ != stage::CREATED) return;
  visit last(*this, nullptr);
  instance_scope running(core_);
  library_->entries().destroy();
}

ta_instance::visit::visit(ta_instance& target, const TEE_Identity* client)
    : target_(target), inside_(target.gate_.enter()) {
  if (inside_) target_.core_.set_client(client);
}

ta_instance::visit::~visit() {
  if (!inside_) return;
  target_.run_pending_closes();
  target_.core_.set_client(nullptr);
  target_.gate_.leave();
}

TEE_Result ta_instance::create() {
  const TEE_Identity client = *core_.client();
  core_.set_client(nullptr);
  instance_scope running(core_);
  TEE_Result res = library_->entries().create();
  core_.set_client(&client);
  stage_ = res == TEE_SUCCESS ? stage::CREATED : stage::FAILED;
  return res;
}

TEE_Result ta_instance::open_session(call_parameters* parameters, void** context) {
  instance_scope running(core_, parameters);
  return library_->entries().open_session(parameters->types, parameters->slots.data(), context);
}

TEE_Result ta_instance::invoke(void* context, uint32_t command, call_parameters* parameters) {
  instance_scope running(core_, parameters);
  return library_->entries().invoke_command(context, command, parameters->types,
                                            parameters->slots.data());
}

void ta_instance::close_session(void* context, const TEE_Identity& client) {
  visit closing(*this, &client);
  if (closing.inside()) {
    run_close({context, client});
    return;
  }
  std::lock_guard lock(pending_mutex_);
  pending_.push_back({context, client});
  any_pending_ = true;
}

void ta_instance::run_close(const pending_close& session) {
  core_.set_client(&session.client);
  instance_scope running(core_);
  library_->entries().close_session(session.context);
}

// One at a time: a close entry point may make further ones pending.
void ta_instance::run_pending_closes() {
  while (any_pending_) {
    std::unique_lock lock(pending_mutex_);
    pending_close next = pending_.back();
    pending_.pop_back();
    any_pending_ = !pending_.empty();
    lock.unlock();
    run_close(next);
  }
}

}  // namespace tee
