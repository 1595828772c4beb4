// The trusted applications of an open device: which ones are loaded, and sessions with them.
#pragma once

#include "tee_internal_api.h"

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "tee/core/session.h"
#include "tee/device/device.h"
#include "tee/device/uuid.h"
#include "tee/host/ta_instance.h"

namespace tee {

// One for each device that the process has open, shared by all who use the device. Instances live
// as their rules have it (ta_instance.h), at most until the host is destroyed. One that is kept
// alive is made by the first session and stays, so that what a trusted application keeps in its
// globals lasts from session to session.
class ta_host final : public session_opener {
 public:
  // open: the host of the device at `path`; opens the device if this process does not have it open.
  // Throws device_error.
  static std::shared_ptr<ta_host> open(const std::string& path);

  // What open makes its results with.
  ta_host(std::string key, std::unique_ptr<device> dev);
  ta_host(const ta_host&) = delete;
  ta_host& operator=(const ta_host&) = delete;

  // Ends the instances, callers before those whom they have sessions with, and closes the device.
  ~ta_host();

  call_result open_session(const TEE_UUID& destination, const TEE_Identity& client,
                           call_parameters* parameters, std::shared_ptr<session>* opened) override;

  // instance_of: the instance of `uuid` for a further session, loaded if there is none that takes
  // it. Codes as ta_library::load.
  [[nodiscard]] TEE_Result instance_of(const TEE_UUID& uuid, std::shared_ptr<ta_instance>* found);

  // find: an instance of `uuid`, or null.
  std::shared_ptr<ta_instance> find(const TEE_UUID& uuid);

  // drop: forgets an instance that nobody may enter any more.
  void drop(const ta_instance& ended);

 private:
  std::shared_ptr<ta_instance> take_next_to_end();
  void end_sessions_with(const instance& target);

  const std::string key_;
  std::unique_ptr<device> device_;
  std::mutex mutex_;
  std::multimap<uuid_bytes, std::shared_ptr<ta_instance>> instances_;
};

// find_instance: the instance of `ta` on any open device; null when none is alive.
std::shared_ptr<instance> find_instance(const TEE_UUID& ta);

}  // namespace tee
