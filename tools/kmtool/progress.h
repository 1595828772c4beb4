// Progress of long work, on a terminal.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace kmtool {

// progress: says on standard error how far the work is, from its second second on and only on a
// terminal; the line is gone when the work ends.
class progress {
 public:
  progress(std::string label, std::optional<uint64_t> total_bytes);
  progress(const progress&) = delete;
  progress& operator=(const progress&) = delete;
  ~progress();

  // advance: so many bytes more are done.
  void advance(uint64_t count);

 private:
  using clock = std::chrono::steady_clock;
  void draw(clock::time_point now);

  std::string label_;
  std::optional<uint64_t> total_;
  uint64_t done_ = 0;
  bool on_terminal_;
  bool drawn_ = false;
  clock::time_point start_ = clock::now();
  clock::time_point last_ = start_;
};

}  // namespace kmtool
