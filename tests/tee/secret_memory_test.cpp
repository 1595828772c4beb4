// Where keys lie: locked, and not in core dumps.
#include "tee/device/secret_memory.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <gtest/gtest.h>
#include <random>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tee/device/secret_bytes.h"
#include "tests/tee/temp_device.h"

namespace tee::test {
namespace {

// The kernel's flags of the mapping that holds the address.
std::string flags_of(const void* address) {
  std::ifstream maps("/proc/self/smaps");
  const auto wanted = reinterpret_cast<uintptr_t>(address);
  bool inside = false;
  for (std::string line; std::getline(maps, line);) {
    unsigned long first = 0;
    unsigned long end = 0;
    if (sscanf(line.c_str(), "%lx-%lx", &first, &end) == 2) {
      inside = first <= wanted && wanted < end;
    }
    if (inside && line.starts_with("VmFlags:")) return line + " ";
  }
  return "";
}

// Why this machine cannot show what is left out of core dumps; empty: it can.
std::string cannot_show_dumps() {
#ifdef __SANITIZE_ADDRESS__
  return "secrets lie in the sanitizer's heap";
#endif
  const size_t size = 4096;
  void* page = mmap(nullptr, size, PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  madvise(page, size, MADV_DONTDUMP);
  const bool told = flags_of(page).find(" dd ") != std::string::npos;
  munmap(page, size);
  return told ? "" : "the kernel is an emulator's";
}

TEST(secret_memory, is_locked_and_left_out_of_core_dumps) {
  if (const std::string why = cannot_show_dumps(); !why.empty()) GTEST_SKIP() << why;
  const secret_bytes key(32, 'k');
  const secret_bytes bulk(100'000, 'b');
  EXPECT_NE(flags_of(key.data()).find(" dd "), std::string::npos) << flags_of(key.data());
  EXPECT_NE(flags_of(bulk.data()).find(" dd "), std::string::npos) << flags_of(bulk.data());
  const bool locked = flags_of(key.data()).find(" lo ") != std::string::npos;
  EXPECT_NE(locked, take_lock_failure() != 0);
  EXPECT_EQ(take_lock_failure(), 0);  // told once
}

// Blocks of many sizes, mixed, never overlap and stay as they were written.
TEST(secret_memory, blocks_are_apart) {
  std::mt19937 random(1);
  std::vector<secret_bytes> held(200);
  for (int round = 0; round < 10'000; round++) {
    secret_bytes& slot = held[random() % held.size()];
    ASSERT_EQ(std::count(slot.begin(), slot.end(), static_cast<uint8_t>(slot.size())),
              static_cast<ptrdiff_t>(slot.size()));
    const size_t size = random() % 50 == 0 ? random() % 70'000 : random() % 200;
    slot = secret_bytes(size, static_cast<uint8_t>(size));
    ASSERT_EQ(reinterpret_cast<uintptr_t>(slot.data()) % alignof(std::max_align_t), 0U);
  }
}

// A process that dies with a device open; where cores go elsewhere there is none to look into.
TEST(secret_memory, a_core_dump_holds_no_key_of_the_device) {
  if (const std::string why = cannot_show_dumps(); !why.empty()) GTEST_SKIP() << why;
  temp_device made;
  std::filesystem::remove_all(made.path());
  device::create(made.path(), {});  // with an identity that the test does not hold
  const pid_t child = fork();
  if (child == 0) {
    const rlimit all = {RLIM_INFINITY, RLIM_INFINITY};
    if (chdir(made.path().c_str()) != 0 || setrlimit(RLIMIT_CORE, &all) != 0) _exit(1);
    prctl(PR_SET_DUMPABLE, 1);  // another test may have changed the user
    auto dev = made.open();
    std::abort();
  }
  waitpid(child, nullptr, 0);
  std::string core;
  for (const auto& file : std::filesystem::directory_iterator(made.path())) {
    if (file.path().filename().string().starts_with("core")) core = content_of(file.path());
  }
  if (core.empty()) GTEST_SKIP() << "no core was written";
  EXPECT_NE(core.find(made.path()), std::string::npos);
  EXPECT_EQ(core.find(content_of(made.file("device.key")).substr(8)), std::string::npos);
  EXPECT_EQ(core.find(content_of(made.file("identity")).substr(12, 16)), std::string::npos);
}

}  // namespace
}  // namespace tee::test
