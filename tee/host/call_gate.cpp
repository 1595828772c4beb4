// The entrance to an instance: one chain of calls at a time, and no waiting for ever.
#include "tee/host/call_gate.h"

#include <condition_variable>
#include <mutex>

namespace tee {

struct call_chain {
  const call_gate* awaited = nullptr;  // the gate at which it stands
};

namespace {

// One lock for all gates: who waits for whom is looked at as a whole. Never destroyed, since
// programs may close sessions as late as they like.
struct gate_state {
  std::mutex mutex;
  std::condition_variable left;
  size_t waiting = 0;
};

gate_state& gates() {
  static gate_state& state = *new gate_state;
  return state;
}

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

bool call_gate::enter() {
  call_chain& chain = own_chain();
  std::unique_lock lock(gates().mutex);
  while (holder_ != nullptr) {
    if (waits_for(chain)) return false;
    chain.awaited = this;
    ++gates().waiting;
    gates().left.wait(lock);
    --gates().waiting;
    chain.awaited = nullptr;
  }
  holder_ = &chain;
  return true;
}

void call_gate::leave() {
  std::lock_guard lock(gates().mutex);
  holder_ = nullptr;
  if (gates().waiting > 0) gates().left.notify_all();
}

}  // namespace tee
