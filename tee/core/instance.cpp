// Instances, and which one runs on the calling thread.
#include "tee/core/instance.h"

#include "tee_extensions.h"

#include "tee/core/log.h"
#include "tee/device/uuid.h"

namespace tee {
namespace {

constexpr uint32_t DEFAULT_STACK = 8 << 20;  // bytes; what a thread of the host has

// Read in every call: initial-exec spares them the call that finds a library's thread-local data,
// and one pointer always finds room in the static block.
__attribute__((tls_model("initial-exec"))) thread_local instance* running = nullptr;

}  // namespace

instance::instance(const TEE_UUID& uuid, device& dev, size_t heap_limit, session_opener* opener)
    : uuid_(uuid), device_(dev), memory_(heap_limit), opener_(opener) {
  properties_["gpd.ta.appID"] = uuid;
  properties_["gpd.ta.stackSize"] = DEFAULT_STACK;
  properties_["gpd.ta.endian"] = LITTLE_ENDIAN_CODE;
  properties_["gpd.ta.doesNotCloseHandleOnCorruptObject"] = false;
  properties_["gpd.ta.version"] = "";
  properties_["gpd.ta.description"] = "";
}

instance::~instance() {
  live_counts left = counts();
  if (left == live_counts{}) return;
  log_line(TEE_TRACE_ERROR,
           "instance %s ended with %zu heap blocks (%zu bytes), %zu objects, %zu operations, %zu "
           "sessions alive",
           to_text(uuid_).c_str(), left.heap_blocks, left.heap_bytes, left.objects, left.operations,
           left.sessions);
}

// Operations hold keys of their own, so that the order among them is free; what lies in the heap
// nobody needs any more.
void instance::reclaim() {
  sessions_.clear();
  operations_.clear();
  objects_.clear();
  memory_.release_all();
  keys_ = {};
}

void instance::set_client(const TEE_Identity* client) {
  client_ = client ? std::optional(*client) : std::nullopt;
}

live_counts instance::counts() const {
  return {memory_.live_bytes(), memory_.live_blocks(), objects_.size(), operations_.size(),
          sessions_.size()};
}

bool instance::holds_of_client(const void* data, size_t length) const {
  if (!parameters_ || length == 0) return false;
  const auto begin = reinterpret_cast<uintptr_t>(data);
  for (size_t i = 0; i < PARAM_COUNT; ++i) {
    if (TEE_PARAM_TYPE_GET(parameters_->types, i) < TEE_PARAM_TYPE_MEMREF_INPUT) continue;
    const auto& memory = parameters_->slots[i].memref;
    const auto theirs = reinterpret_cast<uintptr_t>(memory.buffer);
    if (begin < theirs + memory.size && theirs < begin + length) return true;
  }
  return false;
}

instance_scope::instance_scope(instance& entered, const call_parameters* parameters)
    : outer_(running), outer_parameters_(entered.parameters_) {
  running = &entered;
  entered.parameters_ = parameters;
}

instance_scope::~instance_scope() {
  running->parameters_ = outer_parameters_;
  running = outer_;
}

instance& current_instance(const char* call) {
  if (!running) panic(call, "called outside of a trusted application");
  return *running;
}

}  // namespace tee
