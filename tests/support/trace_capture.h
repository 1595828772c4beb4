// The trace lines of the TEE, taken apart, in place of standard error.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace keymaster::test {

class trace_capture {
 public:
  // From here on lines up to `level` are kept, until the end of the object's life.
  explicit trace_capture(uint32_t level);
  trace_capture(const trace_capture&) = delete;
  trace_capture& operator=(const trace_capture&) = delete;
  ~trace_capture();

  // has: whether a line reads "function: message", as in "begin: Open key failed"; without the
  // newline, level, thread and line number that every line carries.
  bool has(std::string_view line) const;

  // errors: the lines of level 1, each "function: message", joined with " | ".
  const std::string& errors() const { return errors_; }

  void clear();

 private:
  static void take(void* self, uint32_t level, const char* line, size_t length);

  std::vector<std::string> lines_;
  std::string errors_;
};

}  // namespace keymaster::test
