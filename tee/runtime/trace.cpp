// Trace output: which lines go out, and where to.
#include "tee_extensions.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <unistd.h>

#include "tee/runtime/host_control.h"

namespace {

constexpr uint32_t MAX_LEVEL = TEE_TRACE_FLOW;

uint32_t level_from_environment() {
  const char* text = std::getenv("TEE_TRACE_LEVEL");
  bool valid = text && text[0] >= '0' && text[0] <= '4' && text[1] == '\0';
  return valid ? static_cast<uint32_t>(text[0] - '0') : TEE_TRACE_ERROR;
}

std::atomic<uint32_t>& threshold() {
  static std::atomic<uint32_t> level = level_from_environment();
  return level;
}

// The sink is set while no trusted application runs.
struct {
  tee::host::trace_sink write = nullptr;
  void* context = nullptr;
} sink;

}  // namespace

uint32_t TEE_TraceThreshold() {
  return threshold().load(std::memory_order_relaxed);
}

uint32_t TEE_TraceThread() {
  thread_local const auto THREAD = static_cast<uint32_t>(gettid());
  return THREAD;
}

void TEE_TraceWrite(uint32_t level, const char* line, size_t length) {
  if (level > TEE_TraceThreshold() || !line) return;
  if (sink.write) {
    sink.write(sink.context, level, line, length);
  } else {
    std::fwrite(line, 1, length, stderr);
  }
}

void tee::host::set_trace_sink(trace_sink write, void* context) {
  sink.write = write;
  sink.context = context;
}

void tee::host::set_trace_level(uint32_t level) {
  threshold() = level < MAX_LEVEL ? level : MAX_LEVEL;
}
