// The object store under attack and in trouble.
#include <map>

#include "tee/device/object_rows.h"
#include "tests/tee/store.h"

namespace tee::test {
namespace {

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

}  // namespace
}  // namespace tee::test
