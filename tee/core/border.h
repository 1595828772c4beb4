// The border between the TEE and the code of a trusted application: entry points are run across it,
// API calls come back over it, and so does whoever has to leave the code for good.
#pragma once

#include <cstdint>
#include <type_traits>

namespace tee {

// Where the calling thread is, as signal handlers see it. Read and written in every API call:
// initial-exec spares them the call that finds a library's thread-local data.
struct border_state {
  // A call of the TEE in which a watcher found the thread.
  enum sample : uint8_t { NONE, FOUND, LAST };  // LAST: the call is not to return
  volatile bool in_trusted = false;             // in code of a trusted application, not of the TEE
  const void* volatile innermost = nullptr;     // where to come back to; null: nothing runs
  volatile sample sampled = NONE;
  uintptr_t stack_floor = 0;  // the TEE's own calls want the stack to be above it
};
extern constinit __attribute__((tls_model("initial-exec"))) thread_local border_state at_border;

// What took a thread out of a trusted application's code: 0, it returned; else a signal's number
// or one of these.
constexpr int LEFT_BY_PANIC = -1;
constexpr int LEFT_AS_RUNAWAY = -2;

// cross_border: code(context), a call to a trusted application. Gives what took it out. When that
// is not 0, the code's frames are gone without having been unwound, so they must be of trusted code
// alone, and the instance must not be entered again. Borders nest.
[[nodiscard]] int cross_border(void (*code)(void*), void* context);

template <typename Code>
[[nodiscard]] int run_trusted(Code code) {
  return cross_border([](void* context) { (*static_cast<Code*>(context))(); }, &code);
}

// leave_trusted: back to the innermost border of the calling thread, which has one. Nothing that
// needs unwinding may lie between; from a signal handler it may only be called while the thread is
// in trusted code.
[[noreturn]] void leave_trusted(int cause);

// prepare_threads: has every thread run `prepare` before it enters trusted code for the first time.
void prepare_threads(void (*prepare)());

// A stay in the TEE's own code, on behalf of trusted code that called it.
class host_scope {
 public:
  host_scope() : came_from_(at_border.in_trusted) { at_border.in_trusted = false; }
  host_scope(const host_scope&) = delete;
  host_scope& operator=(const host_scope&) = delete;
  ~host_scope() {
    at_border.in_trusted = came_from_;
    if (at_border.sampled != border_state::NONE && came_from_) [[unlikely]]
      end_sample();
  }

  // has_stack: whether there is enough left for the TEE's own calls.
  static bool has_stack() {
    return reinterpret_cast<uintptr_t>(__builtin_frame_address(0)) >= at_border.stack_floor;
  }

 private:
  static void end_sample();
  bool came_from_;
};

}  // namespace tee
