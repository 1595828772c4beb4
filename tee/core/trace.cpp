// Trace output: which lines go out, and where to.
#include "tee/core/trace.h"

#include "tee_extensions.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>

namespace tee {
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

struct {
  trace_sink write = nullptr;
  void* context = nullptr;
} sink;

}  // namespace

uint32_t trace_threshold() {
  return threshold().load(std::memory_order_relaxed);
}

void set_trace_level(uint32_t level) {
  threshold() = level < MAX_LEVEL ? level : MAX_LEVEL;
}

void write_trace(uint32_t level, const char* line, size_t length) {
  if (level > trace_threshold() || !line) return;
  if (sink.write) {
    sink.write(sink.context, level, line, length);
  } else {
    std::fwrite(line, 1, length, stderr);
  }
}

void set_trace_sink(trace_sink write, void* context) {
  sink.write = write;
  sink.context = context;
}

}  // namespace tee
