// The trusted applications of an open device.
#include "tee/host/ta_host.h"

#include <algorithm>
#include <condition_variable>
#include <filesystem>
#include <new>
#include <system_error>
#include <utility>

#include "tee/core/log.h"
#include "tee/device/secret_memory.h"
#include "tee/host/ta_session.h"

namespace tee {

namespace {

// The hosts of the process by their devices' paths. A host that is ending has its place until the
// device is closed. Never destroyed, since programs may end contexts as late as they like.
struct host_list {
  struct place {
    std::weak_ptr<ta_host> shared;
    ta_host* host;
  };
  std::mutex mutex;
  std::condition_variable ended;
  std::map<std::string, place> places;
};

host_list& hosts() {
  static host_list& list = *new host_list;
  return list;
}

// One text for all paths that lead to the same folder.
std::string key_of(const std::string& path) {
  std::error_code failed;
  std::filesystem::path resolved = std::filesystem::canonical(path, failed);
  return failed ? path : resolved.string();
}

}  // namespace

std::shared_ptr<ta_host> ta_host::open(const std::string& path) {
  const std::string key = key_of(path);
  std::unique_lock lock(hosts().mutex);
  for (auto found = hosts().places.find(key); found != hosts().places.end();
       found = hosts().places.find(key)) {
    if (auto host = found->second.shared.lock()) {
      host->device_->require_at(key);
      return host;
    }
    hosts().ended.wait(lock);
  }
  auto host = std::make_shared<ta_host>(key, device::open(key));
  if (int failure = take_lock_failure()) {
    log_line(TEE_TRACE_ERROR, "keys can be swapped out: cannot lock memory: %s (see ulimit -l)",
             std::generic_category().message(failure).c_str());
  }
  hosts().places.insert({key, {host, host.get()}});
  return host;
}

ta_host::ta_host(std::string key, std::unique_ptr<device> dev)
    : key_(std::move(key)), device_(std::move(dev)) {}

ta_host::~ta_host() {
  while (auto next = take_next_to_end()) {
    // Among instances that have sessions with each other someone must be the first.
    if (next.use_count() > 1) end_sessions_with(next->core());
  }
  device_.reset();
  std::lock_guard lock(hosts().mutex);
  hosts().places.erase(key_);
  hosts().ended.notify_all();
}

// Takes an instance with which nobody has a session, or any one if there is no such.
std::shared_ptr<ta_instance> ta_host::take_next_to_end() {
  std::lock_guard lock(mutex_);
  auto next = instances_.begin();
  for (auto it = instances_.begin(); it != instances_.end(); ++it) {
    if (it->second.use_count() == 1) next = it;
  }
  if (next == instances_.end()) return nullptr;
  return std::move(instances_.extract(next).mapped());
}

void ta_host::end_sessions_with(const instance& target) {
  std::unique_lock lock(mutex_);
  auto others = instances_;
  lock.unlock();
  for (auto& [uuid, other] : others) {
    other->core().sessions().for_each(
        [&](TEE_TASessionHandle, const std::shared_ptr<session>& held) {
          if (held->is_with(target)) held->close();
        });
  }
}

call_result ta_host::open_session(const TEE_UUID& destination, const TEE_Identity& client,
                                  call_parameters* parameters, std::shared_ptr<session>* opened) {
  try {
    return ta_session::open(*this, destination, client, parameters, opened);
  } catch (const std::bad_alloc&) {
    return {TEE_ERROR_OUT_OF_MEMORY, TEE_ORIGIN_TEE};
  }
}

TEE_Result ta_host::instance_of(const TEE_UUID& uuid, std::shared_ptr<ta_instance>* found) {
  std::lock_guard lock(mutex_);
  auto place = instances_.find(to_bytes(uuid));
  if (place == instances_.end() || !place->second->rules().single_instance) {
    std::shared_ptr<ta_instance> made;
    if (TEE_Result res = ta_instance::load(uuid, *device_, *this, &made)) return res;
    place = instances_.emplace(to_bytes(uuid), std::move(made));
  }
  *found = place->second;
  return TEE_SUCCESS;
}

std::shared_ptr<ta_instance> ta_host::find(const TEE_UUID& uuid) {
  std::lock_guard lock(mutex_);
  auto place = instances_.find(to_bytes(uuid));
  return place == instances_.end() ? nullptr : place->second;
}

void ta_host::drop(const ta_instance& ended) {
  std::shared_ptr<ta_instance> last;  // goes after the lock
  std::lock_guard lock(mutex_);
  auto place = std::find_if(instances_.begin(), instances_.end(),
                            [&](const auto& entry) { return entry.second.get() == &ended; });
  if (place == instances_.end()) return;
  last = std::move(place->second);
  instances_.erase(place);
}

std::shared_ptr<instance> find_instance(const TEE_UUID& ta) {
  std::lock_guard lock(hosts().mutex);
  for (const auto& [key, place] : hosts().places) {
    auto found = place.host->find(ta);
    if (found) return {found, &found->core()};
  }
  return nullptr;
}

}  // namespace tee
