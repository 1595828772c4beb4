// What stands behind the `imp` members of the client API's structures. An `imp` is a number that is
// looked up, never an address, so one that is stale, zero or made up is seen and refused.
#pragma once

#include "tee_client_api.h"

#include <cstdint>
#include <exception>
#include <map>
#include <memory>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "tee/core/cancellation.h"
#include "tee/core/session.h"
#include "tee/device/secret_bytes.h"

namespace tee {

// The live things of one kind, by their numbers. Safe to use from any thread.
template <typename T>
class imp_table {
 public:
  void* add(std::shared_ptr<T> value) {
    std::lock_guard lock(mutex_);
    values_.emplace(++last_, std::move(value));
    return reinterpret_cast<void*>(last_);
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

struct client_context {
  std::shared_ptr<session_opener> host;
};

struct client_session {
  const void* context;  // imp of its context
  std::shared_ptr<session_opener> host;
  std::shared_ptr<tee::session> session;  // goes before the host
};

// Shared memory: the client's own, or from here.
struct client_memory {
  const void* context;  // imp of its context
  secret_bytes own;     // empty for the client's own
  uint8_t* buffer;
  size_t size;
  uint32_t flags;  // TEEC_MEM_
};

// A call with an operation, while it lasts; null: a call that nobody can cancel. A client cancels
// by the operation's address, from another thread.
class operation_in_flight {
 public:
  explicit operation_in_flight(const TEEC_Operation* operation);
  operation_in_flight(const operation_in_flight&) = delete;
  operation_in_flight& operator=(const operation_in_flight&) = delete;
  ~operation_in_flight();

  const cancellation* asked() const { return operation_ != nullptr ? &asked_ : nullptr; }

  // cancel: requests the end of all calls with `operation`; none: no effect.
  static void cancel(const TEEC_Operation* operation);

 private:
  const TEEC_Operation* operation_;
  cancellation asked_;
  operation_in_flight* before_ = nullptr;  // the list of them all
  operation_in_flight* after_ = nullptr;
};

// The tables of the process. Never destroyed: a program may end its contexts as late as it likes,
// and one that never does ends without running trusted code.
imp_table<client_context>& contexts();
imp_table<client_session>& client_sessions();
imp_table<client_memory>& client_memories();

// client_call: runs the body of an API function that gives a result; what it throws becomes
// TEEC_ERROR_OUT_OF_MEMORY or, traced, TEEC_ERROR_GENERIC.
TEEC_Result trace_failure(const char* what) noexcept;

template <typename Body>
TEEC_Result client_call(Body body) noexcept {
  try {
    return body();
  } catch (const std::bad_alloc&) {
    return TEEC_ERROR_OUT_OF_MEMORY;
  } catch (const std::exception& error) {
    return trace_failure(error.what());
  }
}

}  // namespace tee
