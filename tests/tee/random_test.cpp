// Random bytes come from a pool: no byte of it may be handed out twice, here or in a forked child.
#include "tee/crypto/random.h"

#include <array>
#include <gtest/gtest.h>
#include <set>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace tee {
namespace {

using sample = std::array<uint8_t, 12>;

sample draw() {
  sample bytes{};
  crypto::fill_random(bytes);
  return bytes;
}

// The child's next sample, in memory that both see.
sample draw_in_child() {
  void* shared =
      mmap(nullptr, sizeof(sample), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  const pid_t child = fork();
  if (child == 0) {
    *static_cast<sample*>(shared) = draw();
    _exit(0);
  }
  EXPECT_EQ(waitpid(child, nullptr, 0), child);
  const sample told = *static_cast<sample*>(shared);
  munmap(shared, sizeof(sample));
  return told;
}

// Enough to use up many pools, with requests of all lengths in between.
TEST(random, bytes_are_never_handed_out_twice) {
  std::set<sample> seen{sample{}};
  for (size_t length = 0; length < 300; ++length) {
    std::vector<uint8_t> other(length + 1, 0);
    crypto::fill_random(std::span(other).first(length));
    EXPECT_EQ(other.back(), 0) << length;
    EXPECT_TRUE(seen.insert(draw()).second) << length;
  }
}

TEST(random, a_forked_child_has_bytes_of_its_own) {
  draw();  // the pool is filled
  const sample of_child = draw_in_child();
  EXPECT_NE(of_child, sample{});
  EXPECT_NE(of_child, draw());
  EXPECT_NE(of_child, draw_in_child());
}

}  // namespace
}  // namespace tee
