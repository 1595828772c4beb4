// An instance of a trusted application with its code: created, entered, destroyed.
#pragma once

#include "tee_internal_api.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

#include "tee/core/instance.h"
#include "tee/host/call_gate.h"
#include "tee/host/ta_library.h"

namespace tee {

// The size of the heap of a trusted application that does not declare gpd.ta.dataSize, in bytes.
constexpr uint32_t DEFAULT_HEAP_LIMIT = 16 * 1024 * 1024;

// Every trusted application is single-instance and multi-session: all sessions share the globals.
// Its entry points never run at the same time, and never nest.
class ta_instance {
 public:
  // load: an instance whose code is loaded and whose create entry point has not run yet. Codes as
  // ta_library::load. The device and the opener of its sessions must outlive it.
  [[nodiscard]] static TEE_Result load(const TEE_UUID& uuid, device& dev, session_opener& opener,
                                       std::shared_ptr<ta_instance>* made);

  // What load makes its results with.
  ta_instance(const TEE_UUID& uuid, device& dev, session_opener& opener,
              std::unique_ptr<ta_library> library, const property_map& declared);
  ta_instance(const ta_instance&) = delete;
  ta_instance& operator=(const ta_instance&) = delete;

  // Runs the destroy entry point if create succeeded; what the trusted application left is reported
  // and reclaimed.
  ~ta_instance();

  instance& core() { return core_; }

  enum class stage { LOADED, CREATED, FAILED };  // FAILED: create did

  // Being inside the instance: constructed by the chain of calls that goes in, for as long as it
  // stays. Not `inside` when that would mean waiting for ever (call_gate.h).
  class visit {
   public:
    visit(ta_instance& target, const TEE_Identity* client);
    visit(const visit&) = delete;
    visit& operator=(const visit&) = delete;
    ~visit();
    bool inside() const { return inside_; }

   private:
    ta_instance& target_;
    bool inside_;
  };

  // From here on: only for callers that are inside.

  stage progress() const { return stage_; }

  // create: runs the create entry point, once, without a client; returns its result.
  [[nodiscard]] TEE_Result create();

  [[nodiscard]] TEE_Result open_session(call_parameters* parameters, void** context);
  [[nodiscard]] TEE_Result invoke(void* context, uint32_t command, call_parameters* parameters);

  // End of what is only for those inside.

  // close_session: runs the close entry point; later, when the caller cannot go inside because the
  // instance waits for it.
  void close_session(void* context, const TEE_Identity& client);

 private:
  struct pending_close {
    void* context;
    TEE_Identity client;
  };

  void run_close(const pending_close& session);
  void run_pending_closes();

  std::unique_ptr<ta_library> library_;
  instance core_;
  call_gate gate_;
  stage stage_ = stage::LOADED;
  std::mutex pending_mutex_;
  std::vector<pending_close> pending_;
  std::atomic<bool> any_pending_ = false;  // so that no visit locks for nothing
};

}  // namespace tee
