// Requests to end a call early, and the waits that heed them.
#include "tee/core/cancellation.h"

#include <algorithm>

namespace tee {

namespace {

std::atomic<uint32_t> grace_ms = 10'000;

}  // namespace

std::chrono::milliseconds runaway_grace() {
  return std::chrono::milliseconds(grace_ms.load());
}

void set_runaway_grace(std::chrono::milliseconds grace) {
  grace_ms = static_cast<uint32_t>(grace.count());
}

waiting_room& waiting_room::get() {
  static waiting_room& room = *new waiting_room;
  return room;
}

void waiting_room::wait(std::unique_lock<std::mutex>& lock, std::condition_variable& changed,
                        const cancellation* asked_for, cancellation::clock::time_point until) {
  if (asked_for != nullptr) until = std::min(until, asked_for->deadline());
  if (until == cancellation::clock::time_point::max()) {
    changed.wait(lock);
  } else {
    changed.wait_until(lock, until);
  }
}

cancellation::clock::time_point after(uint32_t timeout_ms) {
  if (timeout_ms == TEE_TIMEOUT_INFINITE) return cancellation::clock::time_point::max();
  return cancellation::clock::now() + std::chrono::milliseconds(timeout_ms);
}

cancellation::cancellation(uint32_t timeout_ms, const cancellation* outer)
    : outer_(outer), deadline_(after(timeout_ms)) {
  if (outer_ != nullptr) deadline_ = std::min(deadline_, outer_->deadline());
}

void cancellation::request() {
  waiting_room& room = waiting_room::get();
  std::lock_guard lock(room.mutex);
  requested_ = true;
  room.left.notify_all();
  room.asked.notify_all();
}

bool cancellation::requested() const {
  for (const cancellation* call = this; call != nullptr; call = call->outer_) {
    if (call->requested_.load(std::memory_order_relaxed)) return true;
  }
  return deadline_ != clock::time_point::max() && clock::now() >= deadline_;
}

bool sleep_until(cancellation::clock::time_point end, const cancellation* asked) {
  waiting_room& room = waiting_room::get();
  std::unique_lock lock(room.mutex);
  while (asked == nullptr || !asked->requested()) {
    if (cancellation::clock::now() >= end) return true;
    waiting_room::wait(lock, room.asked, asked, end);
  }
  return false;
}

}  // namespace tee
