#include "support/trace_capture.h"

#include "tee_extensions.h"

#include <algorithm>

#include "tee/controls/host_control.h"

namespace keymaster::test {
namespace {

// "ERR [0x2a] KEYMASTER:begin:120: Open key failed\n" as "begin: Open key failed". Lines of other
// origin stay as they are.
std::string shorten(std::string_view line) {
  constexpr std::string_view NAME = "KEYMASTER:";
  while (line.ends_with('\n'))
    line.remove_suffix(1);
  const size_t name = line.find(NAME);
  if (name == std::string_view::npos) return std::string(line);
  const std::string_view rest = line.substr(name + NAME.size());
  const size_t function_end = std::min(rest.find(':'), rest.size());
  const size_t number_end = std::min(rest.find(": ", function_end), rest.size());
  return std::string(rest.substr(0, function_end)) + std::string(rest.substr(number_end));
}

}  // namespace

trace_capture::trace_capture(uint32_t level) {
  tee::host::set_trace_level(level);
  tee::host::set_trace_sink(take, this);
}

trace_capture::~trace_capture() {
  tee::host::set_trace_sink(nullptr, nullptr);
  tee::host::set_trace_level(TEE_TRACE_ERROR);
}

void trace_capture::take(void* self, uint32_t level, const char* line, size_t length) {
  auto* capture = static_cast<trace_capture*>(self);
  capture->lines_.push_back(shorten({line, length}));
  if (level != TEE_TRACE_ERROR) return;
  capture->errors_ += (capture->errors_.empty() ? "" : " | ") + capture->lines_.back();
}

bool trace_capture::has(std::string_view line) const {
  return std::ranges::find(lines_, line) != lines_.end();
}

void trace_capture::clear() {
  lines_.clear();
  errors_.clear();
}

}  // namespace keymaster::test
