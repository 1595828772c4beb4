// Surviving what a trusted application does to the process that it runs in. A handler looks where
// its thread is: in trusted code it jumps over the border; in the TEE's own code, which may hold
// locks there, it does not.
#include "tee/host/survival.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <pthread.h>
#include <sys/mman.h>
#include <system_error>
#include <thread>
#include <vector>

#include "tee/core/border.h"

namespace tee {

namespace {

constexpr std::array FAULTS = {SIGSEGV, SIGBUS, SIGFPE, SIGILL};
constexpr int TICK = SIGURG;  // ignored where nobody handles it

constexpr size_t SIGNAL_STACK = 64 * 1024;
// What the TEE's own calls may need below a trusted application's frames: libcrypto and SQLite stay
// far below it.
constexpr size_t HOST_STACK = 256 * 1024;

// A runaway is told by samples: so often it is found in its code or in a further call to the TEE.
constexpr int SAMPLES = 8;

std::array<struct sigaction, FAULTS.size()> earlier;
std::atomic<bool> surviving = false;

__attribute__((tls_model("initial-exec"))) thread_local volatile int samples_left = SAMPLES;

// Of the calls that a chain is in, each may be asked to end on its own account.
struct watched_call {
  const cancellation* asked;
  pthread_t thread;
};

// Guarded by the waiting room's mutex. Never destroyed, as that is not.
std::vector<watched_call>& watched() {
  static auto& calls = *new std::vector<watched_call>;
  return calls;
}

// Outside of trusted code: back to the earlier handler, which the repeated instruction then meets.
void on_fault(int signal, siginfo_t* /*info*/, void* /*context*/) {
  if (at_border.in_trusted) leave_trusted(signal);
  for (size_t i = 0; i < FAULTS.size(); i++) {
    if (FAULTS[i] == signal) sigaction(signal, &earlier[i], nullptr);
  }
}

// The time of a call to the TEE counts once, however long it takes.
void on_tick(int /*signal*/) {
  const bool trusted = at_border.in_trusted;
  if (at_border.innermost == nullptr) return;
  if (!trusted && at_border.sampled != border_state::NONE) return;
  samples_left = samples_left - 1;
  const bool last = samples_left <= 0;
  if (last) samples_left = SAMPLES;  // the next one on this chain has a grace of its own
  if (trusted && last) leave_trusted(LEFT_AS_RUNAWAY);
  if (!trusted) at_border.sampled = last ? border_state::LAST : border_state::FOUND;
}

class signal_stack {
 public:
  signal_stack()
      : base_(mmap(nullptr, SIGNAL_STACK, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1,
                   0)) {
    if (base_ == MAP_FAILED) return;
    const stack_t own{base_, 0, SIGNAL_STACK};
    sigaltstack(&own, &before_);
  }
  signal_stack(const signal_stack&) = delete;
  signal_stack& operator=(const signal_stack&) = delete;
  ~signal_stack() {
    if (base_ == MAP_FAILED) return;
    sigaltstack(&before_, nullptr);
    munmap(base_, SIGNAL_STACK);
  }

 private:
  void* base_;
  stack_t before_{};
};

void prepare_thread() {
  thread_local signal_stack own;
  pthread_attr_t attributes;
  if (pthread_getattr_np(pthread_self(), &attributes) != 0) return;
  void* lowest = nullptr;
  size_t size = 0;
  pthread_attr_getstack(&attributes, &lowest, &size);
  pthread_attr_destroy(&attributes);
  at_border.stack_floor = reinterpret_cast<uintptr_t>(lowest) + std::min(HOST_STACK, size / 2);
}

void handle(int signal, struct sigaction action, struct sigaction* before) {
  sigemptyset(&action.sa_mask);
  if (sigaction(signal, &action, before) != 0) {
    throw std::system_error(errno, std::generic_category(), "sigaction");
  }
}

// Sends ticks to the threads whose calls were asked to end and go on.
[[noreturn]] void watch() {
  for (;;) {
    std::this_thread::sleep_for(runaway_grace() / SAMPLES);
    std::lock_guard lock(waiting_room::get().mutex);
    for (const watched_call& call : watched()) {
      if (call.asked->requested()) pthread_kill(call.thread, TICK);
    }
  }
}

}  // namespace

void survive_faults() {
  if (surviving.exchange(true)) return;
  // Signals are not blocked while they are handled, since a handler may not return.
  struct sigaction fault {};
  fault.sa_sigaction = on_fault;
  fault.sa_flags = SA_SIGINFO | SA_ONSTACK | SA_NODEFER;
  for (size_t i = 0; i < FAULTS.size(); i++)
    handle(FAULTS[i], fault, &earlier[i]);
  struct sigaction tick {};
  tick.sa_handler = on_tick;
  tick.sa_flags = SA_ONSTACK | SA_NODEFER | SA_RESTART;
  handle(TICK, tick, nullptr);
  prepare_threads(prepare_thread);
  sigset_t all;
  sigset_t own;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &own);  // the process's signals are not for the watcher
  std::thread(watch).detach();
  pthread_sigmask(SIG_SETMASK, &own, nullptr);
}

runaway_watch::runaway_watch(const cancellation* asked) : watched_(asked != nullptr && surviving) {
  if (!watched_) return;
  std::lock_guard lock(waiting_room::get().mutex);
  if (at_border.innermost == nullptr) {  // not for what a runaway calls
    samples_left = SAMPLES;
    at_border.sampled = border_state::NONE;
  }
  watched().push_back({asked, pthread_self()});
}

runaway_watch::~runaway_watch() {
  if (!watched_) return;
  std::lock_guard lock(waiting_room::get().mutex);
  auto& calls = watched();
  auto own = std::find_if(calls.rbegin(), calls.rend(), [](const watched_call& call) {
    return pthread_equal(call.thread, pthread_self()) != 0;
  });
  calls.erase(std::next(own).base());
}

}  // namespace tee
