// The border between the TEE and the code of a trusted application. Leaving is a jump: trusted code
// may be compiled without unwind tables, may have been interrupted anywhere, and owns nothing that
// the TEE does not reclaim from its tables.
#include "tee/core/border.h"

#include <atomic>
#include <csetjmp>
#include <exception>

namespace tee {

constinit thread_local border_state at_border;

namespace {

struct crossing {     // NOLINT(*-member-init)
  std::jmp_buf back;  // 200 bytes that _setjmp fills
  volatile int cause = 0;
};

std::atomic<void (*)()> preparation{nullptr};

void prepare_this_thread() {
  thread_local bool prepared = false;
  void (*prepare)() = preparation.load(std::memory_order_acquire);
  if (prepare == nullptr || prepared) return;
  prepared = true;
  prepare();
}

}  // namespace

void prepare_threads(void (*prepare)()) {
  preparation.store(prepare, std::memory_order_release);
}

// The signal mask is not saved, which would be a system call for each command: handlers that leave
// this way do not block their signal.
[[gnu::noinline]] int cross_border(void (*code)(void*), void* context) {
  prepare_this_thread();
  crossing here;
  const void* const outer = at_border.innermost;
  const bool came_from = at_border.in_trusted;
  if (_setjmp(here.back) == 0) {
    at_border.innermost = &here;
    at_border.in_trusted = true;
    code(context);
  }
  at_border.in_trusted = came_from;
  at_border.innermost = outer;
  return here.cause;
}

void leave_trusted(int cause) {
  auto* back = static_cast<crossing*>(const_cast<void*>(at_border.innermost));
  at_border.in_trusted = false;
  back->cause = cause;
  std::longjmp(back->back, 1);
}

// Nothing is open any more but the API function, whose result is a number at most. A panic on its
// way leaves by itself.
void host_scope::end_sample() {
  const bool last = at_border.sampled == border_state::LAST;
  at_border.sampled = border_state::NONE;
  if (last && std::uncaught_exceptions() == 0) leave_trusted(LEFT_AS_RUNAWAY);
}

}  // namespace tee
