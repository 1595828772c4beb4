// The object store under attack, in trouble and after power cuts.
#include "tee_extensions.h"

#include <cerrno>
#include <functional>
#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tee/device/object_store.h"
#include "tests/tee/temp_device.h"

// Calls by which this process changes files. Armed, the n-th from then on is where the power goes,
// or from where on the disk is full.
namespace {

int calls_until_cut = 0;
int calls_until_full = 0;
bool disk_full = false;

long changing_call(long number, long a = 0, long b = 0, long c = 0, long d = 0) {
  if (calls_until_cut > 0 && --calls_until_cut == 0) kill(getpid(), SIGKILL);
  if (calls_until_full > 0 && --calls_until_full == 0) disk_full = true;
  if (disk_full && (number == SYS_write || number == SYS_pwrite64)) {
    errno = ENOSPC;
    return -1;
  }
  return syscall(number, a, b, c, d);
}

long as_long(const void* pointer) {
  return reinterpret_cast<intptr_t>(pointer);
}

}  // namespace

extern "C" {
int fsync(int fd) {
  return static_cast<int>(changing_call(SYS_fsync, fd));
}
int fdatasync(int fd) {
  return static_cast<int>(changing_call(SYS_fdatasync, fd));
}
int ftruncate64(int fd, off64_t size) noexcept {
  return static_cast<int>(changing_call(SYS_ftruncate, fd, size));
}
int unlink(const char* path) noexcept {
  return static_cast<int>(changing_call(SYS_unlink, as_long(path)));
}
int rename(const char* from, const char* to) noexcept {
  return static_cast<int>(changing_call(SYS_rename, as_long(from), as_long(to)));
}
ssize_t write(int fd, const void* data, size_t size) {
  return changing_call(SYS_write, fd, as_long(data), static_cast<long>(size));
}
ssize_t pwrite64(int fd, const void* data, size_t size, off64_t offset) {
  return changing_call(SYS_pwrite64, fd, as_long(data), static_cast<long>(size), offset);
}
}

namespace tee::test {
namespace {

constexpr uint32_t PRIVATE = TEE_STORAGE_PRIVATE;
constexpr uint32_t RPMB = TEE_STORAGE_RPMB;

object_name name_of(uint32_t storage, const std::string& id) {
  return {storage, {7}, {id.begin(), id.end()}};
}

std::span<const uint8_t> bytes_of(const std::string& text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// The object's content, "absent", or the code with which it cannot be had.
std::string state_of(device& dev, uint32_t storage, const std::string& id) {
  try {
    auto content = dev.objects().load(name_of(storage, id));
    return content ? std::string(content->begin(), content->end()) : "absent";
  } catch (const storage_error& error) {
    return error.result() == TEE_ERROR_CORRUPT_OBJECT          ? "corrupt"
           : error.result() == TEE_ERROR_STORAGE_NOT_AVAILABLE ? "unavailable"
           : error.result() == TEE_ERROR_ITEM_NOT_FOUND        ? "no storage"
                                                               : "other";
  }
}

void save(device& dev, uint32_t storage, const std::string& id, const std::string& content) {
  dev.objects().save(name_of(storage, id), bytes_of(content));
}

// Runs SQL on the store from outside; returns the first column of the last row.
std::string sql(const temp_device& made, const std::string& text) {
  sqlite3* db = nullptr;
  EXPECT_EQ(sqlite3_open(made.file("storage.db").c_str(), &db), SQLITE_OK);
  std::string result;
  auto keep = [](void* out, int, char** values, char**) {
    *static_cast<std::string*>(out) = values[0] != nullptr ? values[0] : "";
    return 0;
  };
  EXPECT_EQ(sqlite3_exec(db, text.c_str(), keep, &result, nullptr), SQLITE_OK) << text;
  sqlite3_close(db);
  return result;
}

class storage : public ::testing::TestWithParam<uint32_t> {
 protected:
  storage() { made.open()->make_rpmb(); }
  temp_device made;
};
INSTANTIATE_TEST_SUITE_P(kinds, storage, ::testing::Values(PRIVATE, RPMB));

TEST_P(storage, edited_and_swapped_rows_are_corrupt_and_removed) {
  const char* attacks[] = {
      "UPDATE objects SET sealed = substr(sealed, 1, length(sealed) - 1) WHERE id = x'61'",
      "UPDATE objects SET sealed = CAST(substr(sealed, 1, 14) ||"
      " CASE substr(sealed, 15, 1) WHEN x'5a' THEN x'5b' ELSE x'5a' END ||"
      " substr(sealed, 16) AS BLOB) WHERE id = x'61'",
      "UPDATE objects SET generation = generation + 1 WHERE id = x'61'",
      "DELETE FROM objects WHERE id = x'61'; UPDATE objects SET id = x'61' WHERE id = x'62'",
      "UPDATE objects SET (sealed, generation) ="
      " (SELECT sealed, generation FROM objects WHERE id = x'63') WHERE id = x'61'",
  };
  for (const char* attack : attacks) {
    {
      auto dev = made.open();
      save(*dev, GetParam(), "a", "content a");
      save(*dev, GetParam(), "b", "content b");
      save(*dev, GetParam() == RPMB ? PRIVATE : RPMB, "c", "content a");
    }
    sql(made, "DELETE FROM quarantine");
    sql(made, attack);
    auto dev = made.open();
    EXPECT_EQ(state_of(*dev, GetParam(), "a"), "corrupt") << attack;
    EXPECT_EQ(state_of(*dev, GetParam(), "a"), "absent") << attack;
    EXPECT_EQ(sql(made, "SELECT count(*) FROM quarantine"), "1") << attack;
  }
}

TEST_P(storage, trouble_with_the_database_is_no_loss) {
  auto dev = made.open();
  save(*dev, GetParam(), "a", "kept");
  const std::string db = made.file("storage.db");
  const std::string good = content_of(db);

  sqlite3* locker = nullptr;
  sqlite3_open(db.c_str(), &locker);
  sqlite3_exec(locker, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr);
  EXPECT_EQ(state_of(*dev, GetParam(), "a"), "unavailable");
  EXPECT_THROW(save(*dev, GetParam(), "a", "lost"), storage_error);
  sqlite3_close(locker);
  EXPECT_EQ(state_of(*dev, GetParam(), "a"), "kept");

  std::filesystem::rename(db, db + ".away");
  EXPECT_EQ(state_of(*dev, GetParam(), "a"), "unavailable");
  EXPECT_FALSE(std::filesystem::exists(db));
  for (const std::string& damage : {std::string(), std::string(8192, 'x'), good.substr(0, 200)}) {
    set_content(db, damage);
    EXPECT_EQ(state_of(*dev, GetParam(), "a"), "unavailable");
    std::filesystem::remove(db);
  }
  std::filesystem::rename(db + ".away", db);
  EXPECT_EQ(state_of(*dev, GetParam(), "a"), "kept");
}

// A full disk is reported as such, besides.
TEST_P(storage, a_power_cut_or_a_full_disk_leaves_the_old_object_or_the_new_one) {
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
      pid_t child = fork();
      if (child == 0) {
        auto dev = made.open();
        armed = cuts + 1;
        try {
          change(*dev);
        } catch (const storage_error& error) {
          _exit(error.result() == TEE_ERROR_STORAGE_NO_SPACE ? NO_SPACE : OTHER);
        }
        _exit(DONE);
      }
      int status = 0;
      waitpid(child, &status, 0);
      EXPECT_NE(WEXITSTATUS(status), OTHER) << "cut " << cuts;
      cut = WIFSIGNALED(status) || WEXITSTATUS(status) == NO_SPACE;
      // Twice, since the first look settles what the cut left open.
      for (int look = 0; look < 2; look++) {
        auto dev = made.open();
        std::string now = state_of(*dev, GetParam(), "a");
        EXPECT_TRUE(now == after || (cut && now == before)) << now << " after cut " << cuts;
        EXPECT_EQ(state_of(*dev, GetParam(), "b"), "bystander");
      }
      EXPECT_EQ(sql(made, "PRAGMA integrity_check"), "ok");
    }
    EXPECT_GT(cuts, GetParam() == RPMB ? 12 : 4);
  }
}

TEST(replay_protection, old_copies_and_lost_rows_are_seen) {
  temp_device made;
  const std::string db = made.file("storage.db");
  auto open = [&] {
    auto dev = made.open();
    EXPECT_TRUE(dev->make_rpmb());
    return dev;
  };
  EXPECT_EQ(state_of(*made.open(), RPMB, "a"), "no storage");
  save(*open(), RPMB, "a", "first");
  const std::string first = content_of(db);
  save(*open(), RPMB, "a", "second");
  save(*open(), PRIVATE, "a", "private");

  set_content(db, first);
  EXPECT_EQ(state_of(*open(), RPMB, "a"), "corrupt");
  EXPECT_EQ(state_of(*open(), RPMB, "a"), "absent");
  EXPECT_EQ(state_of(*open(), PRIVATE, "a"), "absent");  // protected from edits, not from replay

  save(*open(), RPMB, "a", "third");
  const std::string third = content_of(db);
  open()->objects().remove(name_of(RPMB, "a"));
  const std::string without = content_of(db);
  set_content(db, third);
  EXPECT_EQ(state_of(*open(), RPMB, "a"), "corrupt");

  save(*open(), RPMB, "a", "fourth");
  set_content(db, without);
  EXPECT_EQ(state_of(*open(), RPMB, "a"), "corrupt");

  // A table that is lost, or another device's, proves nothing.
  save(*open(), RPMB, "a", "fifth");
  std::filesystem::rename(made.file("rpmb"), made.file("away"));
  EXPECT_EQ(state_of(*made.open(), RPMB, "a"), "no storage");
  EXPECT_EQ(state_of(*open(), RPMB, "a"), "corrupt");
  temp_device other;
  { EXPECT_TRUE(other.open()->make_rpmb()); }
  std::filesystem::copy_file(other.file("rpmb"), made.file("rpmb"),
                             std::filesystem::copy_options::overwrite_existing);
  EXPECT_THROW(made.open(), device_error);
  EXPECT_FALSE(temp_device(false).open()->make_rpmb());
}

}  // namespace
}  // namespace tee::test
