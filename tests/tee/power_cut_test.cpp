// The object store where the power goes or the disk fills up, and a device in the earlier form.
#include <cerrno>
#include <dlfcn.h>
#include <signal.h>

#include "tee/device/uuid.h"
#include "tests/tee/store.h"

// Calls by which this process changes files. Armed, the n-th from then on is where the power goes,
// or from where on the disk is full.
namespace {

int calls_until_cut = 0;
int calls_until_full = 0;
bool disk_full = false;

// Whether a change is still made; `needs_room`: it takes space.
bool goes_on(bool needs_room = false) {
  if (calls_until_cut > 0 && --calls_until_cut == 0) kill(getpid(), SIGKILL);
  if (calls_until_full > 0 && --calls_until_full == 0) disk_full = true;
  if (!disk_full || !needs_room) return true;
  errno = ENOSPC;
  return false;
}

// The C library's own function of that name.
template <typename Function>
Function* real(Function*, const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

}  // namespace

extern "C" {
int fsync(int fd) {
  return goes_on() ? real(fsync, "fsync")(fd) : -1;
}
int fdatasync(int fd) {
  return goes_on() ? real(fdatasync, "fdatasync")(fd) : -1;
}
int ftruncate64(int fd, off64_t size) noexcept {
  return goes_on() ? real(ftruncate64, "ftruncate64")(fd, size) : -1;
}
int unlinkat(int folder, const char* path, int flags) noexcept {
  return goes_on() ? real(unlinkat, "unlinkat")(folder, path, flags) : -1;
}
int renameat(int from_folder, const char* from, int to_folder, const char* to) noexcept {
  return goes_on() ? real(renameat, "renameat")(from_folder, from, to_folder, to) : -1;
}
ssize_t write(int fd, const void* data, size_t size) {
  return goes_on(true) ? real(write, "write")(fd, data, size) : -1;
}
ssize_t pwrite64(int fd, const void* data, size_t size, off64_t offset) {
  return goes_on(true) ? real(pwrite64, "pwrite64")(fd, data, size, offset) : -1;
}
}

namespace tee::test {
namespace {

using power_cuts = storage;
INSTANTIATE_TEST_SUITE_P(kinds, power_cuts, ::testing::Values(PRIVATE, RPMB));

// Whether the power went.
bool was_cut(int status) {
  return WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL;
}

// A full disk is reported as such, besides.
TEST_P(power_cuts, a_power_cut_or_a_full_disk_leaves_the_old_object_or_the_new_one) {
  enum { DONE, NO_SPACE, OTHER };
  const std::string content(20'000, 'n');
  // What is there before, the change, and what is there then.
  const std::tuple<const char*, std::function<void(device&)>, std::string> changes[] = {
      {"absent", [&](device& dev) { save(dev, GetParam(), "a", content); }, content},
      {"old", [&](device& dev) { save(dev, GetParam(), "a", content); }, content},
      {"old", [](device& dev) { dev.objects().remove(name_of(GetParam(), "a")); }, "absent"},
  };
  for (int turn = 0; turn < 6; turn++) {
    const auto& [before, change, after] = changes[turn / 2];
    int& armed = turn % 2 == 0 ? calls_until_cut : calls_until_full;
    int cuts = 0;
    for (bool cut = true; cut; cuts++) {
      {
        auto dev = made.open();
        dev->objects().remove(name_of(GetParam(), "a"));
        if (before == std::string("old")) save(*dev, GetParam(), "a", before);
        save(*dev, GetParam(), "b", "bystander");
      }
      const int status = run_apart([&, &change = change] {
        auto dev = made.open();
        armed = cuts + 1;
        try {
          change(*dev);
        } catch (const storage_error& error) {
          return error.result() == TEE_ERROR_STORAGE_NO_SPACE ? NO_SPACE : OTHER;
        }
        return DONE;
      });
      cut = was_cut(status) || WEXITSTATUS(status) == NO_SPACE;
      EXPECT_TRUE(cut || status == DONE) << "cut " << cuts;
      // Twice, since the first look settles what the cut left open.
      for (int look = 0; look < 2; look++) {
        auto dev = made.open();
        std::string now = state_of(*dev, GetParam(), "a");
        EXPECT_TRUE(now == after || (cut && now == before)) << now << " after cut " << cuts;
        EXPECT_EQ(state_of(*dev, GetParam(), "b"), "bystander");
      }
      EXPECT_EQ(sql(made, "PRAGMA integrity_check"), "ok");
    }
    EXPECT_GT(cuts, 12);
  }
}

// A change that was cut off is settled by the object alone: an older copy in between decides
// nothing.
TEST_P(power_cuts, an_old_copy_does_not_settle_a_change) {
  save(*made.open(), GetParam(), "a", "first");
  const std::string first = content_of(db);
  save(*made.open(), GetParam(), "a", "second");
  ASSERT_TRUE(was_cut(run_apart([&] {
    auto dev = made.open();
    calls_until_cut = 12;
    save(*dev, GetParam(), "a", "third");
    return 0;
  })));
  const std::string cut = content_of(db);
  set_content(db, first);
  expect_refused("first");
  set_content(db, cut);
  auto dev = made.open();
  const std::string now = state_of(*dev, GetParam(), "a");
  EXPECT_TRUE(now == "second" || now == "third") << now;
  EXPECT_TRUE(dev->check().empty());
}

// tests/data/earlier_device: a device with three objects, private and replay-protected ones.
class earlier_folder : public ::testing::Test {
 protected:
  earlier_folder() { put(); }
  void put() {
    namespace fs = std::filesystem;
    fs::remove_all(made.path());
    fs::copy(EARLIER_DEVICE, made.path());
    fs::permissions(made.path(), fs::perms::owner_all);
    for (const auto& file : fs::directory_iterator(made.path()))
      fs::permissions(file, fs::perms::owner_read | fs::perms::owner_write);
  }
  temp_device made;
};

TEST_F(earlier_folder, is_brought_over_wherever_the_power_goes) {
  for (int cuts = 1, status = 1; status != 0; cuts++) {
    put();
    status = run_apart([&] {
      calls_until_cut = cuts;
      made.open();
      return 0;
    });
    EXPECT_TRUE(status == 0 || was_cut(status)) << cuts;
    EXPECT_TRUE(status != 0 || cuts > 20);
    auto dev = made.open();
    EXPECT_EQ(to_text(dev->identity()), "8e6bcb0e-0d5c-4a43-9b1c-7f2b1c2d3e4f");
    EXPECT_EQ(dev->settings().os_version, 120000u);
    EXPECT_TRUE(dev->has_rpmb());
    EXPECT_TRUE(dev->check().empty()) << cuts;
    EXPECT_EQ(sql(made, "SELECT count(*) FROM objects WHERE generation > 0"), "3");
    for (const char* file : {"rpmb", "lock"})
      EXPECT_FALSE(std::filesystem::exists(made.file(file))) << file;
  }
}

TEST_F(earlier_folder, is_left_alone_when_something_is_wrong_with_it) {
  const std::tuple<const char*, std::string> cases[] = {
      {"rpmb", ""},
      {"rpmb", std::string(95, 'r')},
      {"device.key", std::string(32, 'k')},
      {"storage.db", ""},
      {"storage.db", std::string(16'384, 's')},
  };
  for (const auto& [file, damage] : cases) {
    const std::string good = content_of(made.file(file));
    set_content(made.file(file), damage);
    EXPECT_THROW(made.open(), device_error) << file;
    std::filesystem::remove(made.file(file));
    EXPECT_THROW(made.open(), device_error) << file;
    set_content(made.file(file), good);
    std::filesystem::permissions(made.file(file), std::filesystem::perms(0600));
  }
  EXPECT_TRUE(made.open()->check().empty());
}

}  // namespace
}  // namespace tee::test
