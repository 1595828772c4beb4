// What stands behind the `imp` members of the client API's structures. An `imp` is a number that is
// looked up, never an address, so one that is stale, zero or made up is seen and refused.
#pragma once

#include <cstdint>
#include <iterator>
#include <map>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

namespace tee {

// Whose number it is, in its lowest bit: of a TEE in the process, or of one that serves it.
enum class way : uintptr_t { IN_PROCESS = 0, SERVED = 1 };

inline way way_of(const void* imp) {
  return static_cast<way>(reinterpret_cast<uintptr_t>(imp) & 1);
}

// The live things of one kind, by their numbers. Safe to use from any thread.
template <typename T, way WAY>
class imp_table {
 public:
  void* add(std::shared_ptr<T> value) {
    std::lock_guard lock(mutex_);
    const uintptr_t number = ++last_ << 1 | static_cast<uintptr_t>(WAY);
    values_.emplace(number, std::move(value));
    return reinterpret_cast<void*>(number);
  }

  // find: null when the number is not a live one.
  std::shared_ptr<T> find(const void* imp) {
    std::lock_guard lock(mutex_);
    auto found = values_.find(reinterpret_cast<uintptr_t>(imp));
    return found == values_.end() ? nullptr : found->second;
  }

  // take: likewise, and ends the number's life.
  std::shared_ptr<T> take(const void* imp) {
    std::lock_guard lock(mutex_);
    auto node = values_.extract(reinterpret_cast<uintptr_t>(imp));
    return node.empty() ? nullptr : std::move(node.mapped());
  }

  // take_all_of: takes those that belong to a context.
  std::vector<std::shared_ptr<T>> take_all_of(const void* context) {
    std::lock_guard lock(mutex_);
    std::vector<std::shared_ptr<T>> taken;
    for (auto it = values_.begin(); it != values_.end();) {
      bool its = it->second->context == context;
      if (its) taken.push_back(it->second);
      it = its ? values_.erase(it) : std::next(it);
    }
    return taken;
  }

 private:
  std::mutex mutex_;
  uintptr_t last_ = 0;
  std::map<uintptr_t, std::shared_ptr<T>> values_;
};

}  // namespace tee
