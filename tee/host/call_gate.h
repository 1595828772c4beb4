// The entrance to an instance: one chain of calls at a time, and no waiting for ever.
#pragma once

#include "tee/core/cancellation.h"

namespace tee {

// A chain of calls is what one client thread has set going: it enters an instance, from there the
// next one, and so on; it holds all of them until it comes back.
struct call_chain;

class call_gate {
 public:
  call_gate() = default;
  call_gate(const call_gate&) = delete;
  call_gate& operator=(const call_gate&) = delete;

  // enter: waits until no other chain is inside, and goes in with the calling thread's chain, but
  // not once `asked` (null: nobody) is requested. HELD, at once, when the wait would never end: the
  // chain is inside already, or whoever is inside waits, directly or through others, for an
  // instance that this chain holds.
  enum class outcome { INSIDE, HELD, CANCELLED };
  [[nodiscard]] outcome enter(const cancellation* asked);

  // try_enter: goes in if nobody is inside.
  [[nodiscard]] bool try_enter();

  // leave: ends what a successful enter began.
  void leave();

 private:
  bool waits_for(const call_chain& chain) const;
  call_chain* holder_ = nullptr;
};

}  // namespace tee
