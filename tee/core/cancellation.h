// Requests to end a call early, and the waits that heed them.
#pragma once

#include "tee_internal_api.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

namespace tee {

// Whoever makes a call keeps one of these for as long as the call lasts, and may request its end
// from any thread. What the call does about it is up to the trusted application; while it waits to
// be let in, it ends at once.
class cancellation {
 public:
  using clock = std::chrono::steady_clock;

  // Requested by request() alone.
  cancellation() = default;

  // Also requested when `timeout_ms` have passed (TEE_TIMEOUT_INFINITE: never), and when `outer`
  // (null: none) is, which outlives it: the call that this one is made in.
  cancellation(uint32_t timeout_ms, const cancellation* outer);
  cancellation(const cancellation&) = delete;
  cancellation& operator=(const cancellation&) = delete;

  void request();
  bool requested() const;

  // deadline: when time makes the request, at the latest; clock::time_point::max(): never.
  clock::time_point deadline() const { return deadline_; }

 private:
  std::atomic<bool> requested_ = false;
  const cancellation* outer_ = nullptr;
  clock::time_point deadline_ = clock::time_point::max();
};

// Where threads of the TEE wait. One for the process, so that who waits for whom can be looked at
// as a whole; never destroyed, since programs may close sessions as late as they like.
struct waiting_room {
  std::mutex mutex;
  std::condition_variable left;   // an instance was left, or a cancellation requested
  std::condition_variable asked;  // a cancellation was requested
  size_t at_gates = 0;            // threads that wait for `left`
  static waiting_room& get();

  // wait: for `changed`, or for the request when `asked_for` is not null.
  static void wait(std::unique_lock<std::mutex>& lock, std::condition_variable& changed,
                   const cancellation* asked_for,
                   cancellation::clock::time_point until = cancellation::clock::time_point::max());
};

// runaway_grace: how long a trusted application may go on after its caller asked it to end: 10 s,
// or as set.
std::chrono::milliseconds runaway_grace();
void set_runaway_grace(std::chrono::milliseconds grace);

// after: `timeout_ms` from now; time_point::max() for TEE_TIMEOUT_INFINITE.
cancellation::clock::time_point after(uint32_t timeout_ms);

// sleep_until: false, at once, when `asked` (null: nobody) is or becomes requested before `end`.
[[nodiscard]] bool sleep_until(cancellation::clock::time_point end, const cancellation* asked);

}  // namespace tee
