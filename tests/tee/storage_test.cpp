// The object store under attack, in trouble and after power cuts.
#include "tee_extensions.h"

#include <algorithm>
#include <cerrno>
#include <dlfcn.h>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <signal.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tee/device/object_rows.h"
#include "tee/device/object_store.h"
#include "tee/device/uuid.h"
#include "tests/tee/temp_device.h"

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

// How a process that does this ends, as waitpid says; it exits with what is returned.
int run_apart(const std::function<int()>& action) {
  const pid_t child = fork();
  if (child == 0) _exit(action());
  int status = 1;
  waitpid(child, &status, 0);
  return status;
}

// Whether the power went.
bool was_cut(int status) {
  return WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL;
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
  // Refused in every way, as often as one asks.
  void expect_refused(const std::string& what) {
    auto dev = made.open();
    for (int look = 0; look < 2; look++)
      EXPECT_EQ(state_of(*dev, GetParam(), "a"), "corrupt") << what;
    EXPECT_THROW(save(*dev, GetParam(), "a", "new"), storage_error) << what;
    EXPECT_THROW(dev->objects().remove(name_of(GetParam(), "a")), storage_error) << what;
    const auto damaged = dev->check();
    ASSERT_FALSE(damaged.empty()) << what;
    EXPECT_TRUE(std::any_of(damaged.begin(), damaged.end(), [](const damaged_object& object) {
      return object.name == name_of(GetParam(), "a");
    })) << what;
  }
  void expect_fine(const std::string& state) {
    auto dev = made.open();
    EXPECT_EQ(state_of(*dev, GetParam(), "a"), state);
    EXPECT_TRUE(dev->check().empty());
  }

  temp_device made;
  const std::string db = made.file("storage.db");
};
INSTANTIATE_TEST_SUITE_P(kinds, storage, ::testing::Values(PRIVATE, RPMB));

TEST_P(storage, edited_and_swapped_rows_are_refused_and_kept) {
  save(*made.open(), GetParam(), "a", "content 0");
  const std::string old = sql(made, "SELECT hex(sealed) FROM objects");
  const std::string attacks[] = {
      "UPDATE objects SET sealed = substr(sealed, 1, length(sealed) - 1) WHERE id = x'61'",
      "UPDATE objects SET sealed = CAST(substr(sealed, 1, 14) ||"
      " CASE substr(sealed, 15, 1) WHEN x'5a' THEN x'5b' ELSE x'5a' END ||"
      " substr(sealed, 16) AS BLOB) WHERE id = x'61'",
      "UPDATE objects SET sealed = x'" + old + "' WHERE id = x'61'",
      "UPDATE objects SET sealed = x'' WHERE id = x'61'",
      "UPDATE objects SET sealed = substr(sealed, 1, 27) WHERE id = x'61'",
      "UPDATE objects SET generation = generation + 1 WHERE id = x'61'",
      "UPDATE objects SET generation = 0 WHERE id = x'61'",
      "DELETE FROM objects WHERE id = x'61'",
      "DELETE FROM objects",
      "DELETE FROM objects WHERE id = x'61'; UPDATE objects SET id = x'61' WHERE id = x'62'",
      "UPDATE objects SET (sealed, generation) ="
      " (SELECT sealed, generation FROM objects WHERE id = x'63') WHERE id = x'61'",
  };
  {
    auto dev = made.open();
    save(*dev, GetParam(), "a", "content a");
    save(*dev, GetParam(), "b", "content b");
    save(*dev, GetParam() == RPMB ? PRIVATE : RPMB, "c", "content a");
  }
  EXPECT_EQ(sql(made, "SELECT count(DISTINCT substr(sealed, 1, 12)) FROM objects"), "3");
  const std::string good = content_of(db);
  for (const std::string& attack : attacks) {
    sql(made, attack);
    expect_refused(attack);
    set_content(db, good);
    expect_fine("content a");
  }
  sql(made, "PRAGMA user_version = 3");
  EXPECT_THROW(made.open(), device_error);
  set_content(db, good);
  sql(made, attacks[0]);
  made.open()->forget(name_of(GetParam(), "a"));
  expect_fine("absent");
  save(*made.open(), GetParam(), "a", "anew");
  expect_fine("anew");
}

TEST_P(storage, old_copies_are_refused_and_the_right_one_still_serves) {
  std::map<std::string, std::string> copies;  // of the database, by the state of "a" in it
  for (const char* state : {"absent", "first", "second"}) {
    if (state != std::string("absent")) save(*made.open(), GetParam(), "a", state);
    save(*made.open(), GetParam(), "b", state);
    copies[state] = content_of(db);
  }
  for (const char* old : {"absent", "first"}) {
    set_content(db, copies[old]);
    expect_refused(old);
    set_content(db, copies["second"]);
    expect_fine("second");
  }
  made.open()->objects().remove(name_of(GetParam(), "a"));
  copies["removed"] = content_of(db);
  set_content(db, copies["second"]);
  expect_refused("came back");
  set_content(db, copies["removed"]);
  expect_fine("absent");
}

TEST_P(storage, trouble_with_the_database_is_no_loss) {
  auto dev = made.open();
  save(*dev, GetParam(), "a", "kept");
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
TEST_P(storage, an_old_copy_does_not_settle_a_change) {
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

// A row opens under its own name and generation alone, even were generations to come twice.
TEST(storage_of_a_device, binds_a_row_to_its_name_and_generation) {
  temp_device made;
  const std::string path = made.path() + "/../rows";
  std::filesystem::create_directory(path);
  const device_folder folder(path);
  const device_key key(DEVICE_KEY_LENGTH);
  object_rows::create(folder, key);
  object_rows rows(folder, key);
  rows.connect();
  const object_name name = name_of(PRIVATE, "a");
  rows.put(name, 0x0102030405060708, bytes_of("content"));
  object_rows::row row = *rows.find(name);
  EXPECT_TRUE(rows.open(name, row));
  for (const object_name& other :
       {object_name{PRIVATE, {7, 1}, {'a'}}, {RPMB, name.ta, {'a'}}, {PRIVATE, name.ta, {'b'}}}) {
    EXPECT_FALSE(rows.open(other, row));
  }
  for (int byte = 0; byte < 8; byte++) {
    row.generation = 0x0102030405060708 ^ uint64_t { 1 } << 8 * byte;
    EXPECT_FALSE(rows.open(name, row)) << byte;
  }
}

TEST(storage_of_a_device, is_there_or_it_does_not_open) {
  EXPECT_EQ(state_of(*temp_device(false).open(), RPMB, "a"), "no storage");
  EXPECT_EQ(state_of(*temp_device(false).open(), PRIVATE, "a"), "absent");
}

// A forked child has the parent's device before its eyes and no part in it.
TEST(storage_of_a_device, is_not_shared_with_a_forked_process) {
  temp_device made;
  auto dev = made.open();
  save(*dev, PRIVATE, "a", "1");
  const int status = run_apart([&] {
    EXPECT_EQ(state_of(*dev, PRIVATE, "a"), "unavailable");
    EXPECT_THROW(save(*dev, PRIVATE, "a", "2"), storage_error);
    return HasFailure() ? 1 : 0;
  });
  EXPECT_EQ(status, 0);
  EXPECT_EQ(state_of(*dev, PRIVATE, "a"), "1");
}

// What was opened is what is written, wherever it lies by now and whatever lies in its place.
TEST(storage_of_a_device, moves_with_its_folder) {
  temp_device made;
  temp_device other;
  { save(*other.open(), PRIVATE, "a", "other"); }
  auto dev = made.open();
  const std::string away = made.path() + ".away";
  std::filesystem::rename(made.path(), away);
  std::filesystem::rename(other.path(), made.path());
  save(*dev, PRIVATE, "a", std::string(20'000, 'm'));
  EXPECT_THROW(device::open(away), device_error);
  EXPECT_EQ(state_of(*made.open(), PRIVATE, "a"), "other");
  dev.reset();
  EXPECT_EQ(state_of(*device::open(away), PRIVATE, "a"), std::string(20'000, 'm'));
  std::filesystem::remove_all(away);
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
