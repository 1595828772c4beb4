// The entrance to an instance: one chain of calls at a time, and no waiting for ever.
#include "tee/host/call_gate.h"

#include <mutex>

namespace tee {

struct call_chain {
  const call_gate* awaited = nullptr;  // the gate at which it stands
};

namespace {

call_chain& own_chain() {
  thread_local call_chain chain;
  return chain;
}

}  // namespace

// Follows the one way there is: from a gate to its holder, to the gate at which that one stands.
bool call_gate::waits_for(const call_chain& chain) const {
  for (const call_gate* gate = this; gate != nullptr && gate->holder_ != nullptr;
       gate = gate->holder_->awaited) {
    if (gate->holder_ == &chain) return true;
  }
  return false;
}

call_gate::outcome call_gate::enter(const cancellation* asked) {
  call_chain& chain = own_chain();
  waiting_room& room = waiting_room::get();
  std::unique_lock lock(room.mutex);
  while (holder_ != nullptr) {
    if (waits_for(chain)) return outcome::HELD;
    if (asked != nullptr && asked->requested()) return outcome::CANCELLED;
    chain.awaited = this;
    ++room.at_gates;
    waiting_room::wait(lock, room.left, asked);
    --room.at_gates;
    chain.awaited = nullptr;
  }
  // Whoever need not wait goes in, even with no time at all: what a request means is then the
  // trusted application's business.
  holder_ = &chain;
  return outcome::INSIDE;
}

bool call_gate::try_enter() {
  std::lock_guard lock(waiting_room::get().mutex);
  if (holder_ != nullptr) return false;
  holder_ = &own_chain();
  return true;
}

void call_gate::leave() {
  waiting_room& room = waiting_room::get();
  std::lock_guard lock(room.mutex);
  holder_ = nullptr;
  if (room.at_gates > 0) room.left.notify_all();
}

}  // namespace tee
