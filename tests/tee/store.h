// What the tests of the object store share: a store on a device of its own, what
// is in it, and SQL that reaches it from outside.
#pragma once

#include "tee_extensions.h"

#include <algorithm>
#include <functional>
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tee/device/object_store.h"
#include "tests/tee/temp_device.h"

namespace tee::test {

constexpr uint32_t PRIVATE = TEE_STORAGE_PRIVATE;
constexpr uint32_t RPMB = TEE_STORAGE_RPMB;

inline object_name name_of(uint32_t storage, const std::string& id) {
  return {storage, {7}, {id.begin(), id.end()}};
}

inline std::span<const uint8_t> bytes_of(const std::string& text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// The object's content, "absent", or the code with which it cannot be had.
inline std::string state_of(device& dev, uint32_t storage, const std::string& id) {
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

inline void save(device& dev, uint32_t storage, const std::string& id, const std::string& content) {
  dev.objects().save(name_of(storage, id), bytes_of(content));
}

// How a process that does this ends, as waitpid says; it exits with what is returned.
inline int run_apart(const std::function<int()>& action) {
  const pid_t child = fork();
  if (child == 0) _exit(action());
  int status = 1;
  waitpid(child, &status, 0);
  return status;
}

// Runs SQL on the store from outside; returns the first column of the last row.
inline std::string sql(const temp_device& made, const std::string& text) {
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

}  // namespace tee::test
