// The progress line.
#include "progress.h"

#include <algorithm>
#include <cstdio>
#include <unistd.h>
#include <utility>

namespace kmtool {

namespace {

using namespace std::chrono_literals;

constexpr double MEGABYTE = 1e6;

}  // namespace

progress::progress(std::string label, std::optional<uint64_t> total_bytes)
    : label_(std::move(label)), total_(total_bytes), on_terminal_(isatty(STDERR_FILENO) == 1) {}

progress::~progress() {
  if (drawn_) fputs("\r\033[K", stderr);
}

void progress::advance(uint64_t count) {
  done_ += count;
  if (!on_terminal_) return;
  clock::time_point now = clock::now();
  if (now - start_ < 1s || now - last_ < 100ms) return;
  last_ = now;
  draw(now);
}

void progress::draw(clock::time_point now) {
  double seconds = std::chrono::duration<double>(now - start_).count();
  double megabytes = static_cast<double>(done_) / MEGABYTE;
  fprintf(stderr, "\r\033[K%s: %.1f MB", label_.c_str(), megabytes);
  if (total_ && *total_ > 0) {
    double share = std::min(1.0, static_cast<double>(done_) / static_cast<double>(*total_));
    fprintf(stderr, " of %.1f MB, %.0f %%", static_cast<double>(*total_) / MEGABYTE, 100 * share);
  }
  fprintf(stderr, ", %.1f MB/s", megabytes / seconds);
  fflush(stderr);
  drawn_ = true;
}

}  // namespace kmtool
