// Surviving what a trusted application does to the process that it runs in.
#pragma once

#include "tee/core/cancellation.h"

namespace tee {

// survive_faults: from now on a bad access, a division by zero, an illegal instruction and an
// exhausted stack in a trusted application's own code end its instance alone, and so does going on
// for runaway_grace() after a request to end; time in the TEE's own calls does not count there.
// Takes the handlers of SIGSEGV, SIGBUS, SIGFPE, SIGILL and SIGURG for good, so it is for processes
// whose business is to run trusted applications. What happens outside of their code goes to the
// handlers that there were. Throws std::system_error.
void survive_faults();

// While one lives, the calling thread runs a trusted application in a call that `asked` (may be
// null: not watched) can end.
class runaway_watch {
 public:
  explicit runaway_watch(const cancellation* asked);
  runaway_watch(const runaway_watch&) = delete;
  runaway_watch& operator=(const runaway_watch&) = delete;
  ~runaway_watch();

 private:
  bool watched_;
};

}  // namespace tee
