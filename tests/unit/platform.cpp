#include "platform.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <map>

namespace platform {

size_t live_blocks;
size_t unwiped_blocks;
int allocations_to_fail;
size_t largest_request;
uint32_t trace_threshold;
uint32_t trace_thread;
std::vector<std::string> trace_lines;

namespace {
std::map<void*, size_t> sizes;
}  // namespace

void reset() {
  live_blocks = unwiped_blocks = largest_request = 0;
  allocations_to_fail = 0;
  trace_threshold = TEE_TRACE_DEBUG;
  trace_thread = 0x2a;
  trace_lines.clear();
}

bool traced(const std::string& text) {
  return !trace_lines.empty() && trace_lines.back().ends_with(": " + text + "\n");
}

}  // namespace platform

using namespace platform;

void* TEE_Malloc(size_t size, uint32_t) {
  largest_request = std::max(largest_request, size);
  if (allocations_to_fail > 0 && --allocations_to_fail == 0) return nullptr;
  void* block = std::malloc(size);
  std::memset(block, 0xA5, size);  // a platform may leave anything there
  sizes[block] = size;
  live_blocks++;
  return block;
}

void TEE_Free(void* block) {
  if (block == nullptr) return;
  const auto* bytes = static_cast<const uint8_t*>(block);
  if (std::any_of(bytes, bytes + sizes[block], [](uint8_t b) { return b != 0; })) unwiped_blocks++;
  sizes.erase(block);
  live_blocks--;
  std::free(block);
}

uint32_t TEE_TraceThreshold() {
  return trace_threshold;
}

uint32_t TEE_TraceThread() {
  return trace_thread;
}

void TEE_TraceWrite(uint32_t, const char* line, size_t length) {
  trace_lines.emplace_back(line, length);
}
