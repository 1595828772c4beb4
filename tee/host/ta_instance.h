// An instance of a trusted application with its code: created, entered, destroyed; or dead.
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

class ta_host;

// The size of the heap of a trusted application that does not declare gpd.ta.dataSize, in bytes.
constexpr uint32_t DEFAULT_HEAP_LIMIT = 16 * 1024 * 1024;

// How many sessions share an instance and how long it lives, as the trusted application declares
// it: gpd.ta.singleInstance (else each session has its own), and for single ones multiSession (else
// one session at a time) and instanceKeepAlive (else it ends with its last session). True where it
// says nothing.
struct instance_rules {
  bool single_instance = true;
  bool multi_session = true;
  bool keep_alive = true;
};

// Entry points of an instance never run at the same time, and never nest.
class ta_instance {
 public:
  // load: an instance whose code is loaded and whose create entry point has not run yet. Codes as
  // ta_library::load. The device and the host must outlive it.
  [[nodiscard]] static TEE_Result load(const TEE_UUID& uuid, device& dev, ta_host& host,
                                       std::shared_ptr<ta_instance>* made);

  // What load makes its results with.
  ta_instance(const TEE_UUID& uuid, device& dev, ta_host& host, std::unique_ptr<ta_library> library,
              const property_map& declared);
  ta_instance(const ta_instance&) = delete;
  ta_instance& operator=(const ta_instance&) = delete;

  // Runs the destroy entry point if create succeeded and it has not run; what the trusted
  // application left is reported and reclaimed.
  ~ta_instance();

  instance& core() { return core_; }
  const instance_rules& rules() const { return rules_; }

  // LOADED: to be created. GONE: create failed, or destroy has run. DEAD: the trusted application
  // failed; its code is unloaded, all that it held is reclaimed. Nobody enters GONE and DEAD ones.
  enum class stage { LOADED, CREATED, GONE, DEAD };

  // Being inside the instance: constructed by the chain of calls that goes in, for as long as it
  // stays. Not `inside` when that would mean waiting for ever (call_gate.h) or `asked` (null:
  // nobody) was requested; `refusal` says which.
  class visit {
   public:
    visit(ta_instance& target, const TEE_Identity* client, const cancellation* asked);
    visit(const visit&) = delete;
    visit& operator=(const visit&) = delete;
    ~visit();
    bool inside() const { return outcome_ == call_gate::outcome::INSIDE; }
    call_result refusal() const;

   private:
    ta_instance& target_;
    call_gate::outcome outcome_;
  };

  // From here on: only for callers that are inside. Results of an instance that is or becomes dead
  // are TEE_ERROR_TARGET_DEAD, from the TEE.

  stage progress() const { return stage_; }

  // open_session: TEE_ERROR_BUSY, from the TEE, when no further session is allowed; else runs the
  // create entry point if that is to be done, without a client, and the open entry point.
  call_result open_session(call_parameters* parameters, void** context);
  call_result invoke(void* context, uint32_t command, call_parameters* parameters);

  // End of what is only for those inside.

  // close_session: has the close entry point run, by the caller if nobody is inside, else by
  // whoever leaves.
  void close_session(void* context, const TEE_Identity& client);

 private:
  struct pending_close {
    void* context;
    TEE_Identity client;
  };

  template <typename Entry>
  bool run(const call_parameters* parameters, const cancellation* asked, Entry entry);
  call_result create(const cancellation* asked);
  void run_close(const pending_close& session);
  void run_pending_closes();
  void settle();
  void end_if_unused();
  void end();
  void die(int cause);

  std::unique_ptr<ta_library> library_;
  ta_host& host_;
  instance_rules rules_;
  instance core_;
  call_gate gate_;
  stage stage_ = stage::LOADED;
  size_t open_sessions_ = 0;
  std::mutex pending_mutex_;
  std::vector<pending_close> pending_;
  std::atomic<bool> any_pending_ = false;  // so that no visit locks for nothing
};

}  // namespace tee
