// Instances, and which one runs on the calling thread.
#include "tee/core/instance.h"

#include "tee_extensions.h"

#include "tee/core/log.h"
#include "tee/device/uuid.h"

namespace tee {
namespace {

// Read in every call: initial-exec spares them the call that finds a library's thread-local data,
// and one pointer always finds room in the static block.
__attribute__((tls_model("initial-exec"))) thread_local instance* running = nullptr;

}  // namespace

instance::instance(const TEE_UUID& uuid, device& dev, size_t heap_limit, session_opener* opener)
    : uuid_(uuid), device_(dev), memory_(heap_limit), opener_(opener) {
  properties_["gpd.ta.appID"] = uuid;
}

instance::~instance() {
  live_counts left = counts();
  if (left == live_counts{}) return;
  log_line(TEE_TRACE_INFO,
           "instance %s ended with %zu heap blocks (%zu bytes), %zu objects, %zu operations, %zu "
           "sessions alive",
           to_text(uuid_).c_str(), left.heap_blocks, left.heap_bytes, left.objects, left.operations,
           left.sessions);
}

void instance::set_client(const TEE_Identity* client) {
  client_ = client ? std::optional(*client) : std::nullopt;
}

live_counts instance::counts() const {
  return {memory_.live_bytes(), memory_.live_blocks(), objects_.size(), operations_.size(),
          sessions_.size()};
}

instance_scope::instance_scope(instance& entered) : outer_(running) {
  running = &entered;
}

instance_scope::~instance_scope() {
  running = outer_;
}

instance& current_instance(const char* call) {
  if (!running) panic(call, "called outside of a trusted application");
  return *running;
}

}  // namespace tee
