// The device folder: creation, settings, boots, the lock, damaged files.
#include "tee/device/device.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tee/device/clock.h"
#include "tee/device/uuid.h"
#include "tests/tee/temp_device.h"

namespace tee::test {
namespace {

using kind = device_error::kind;

// The kind of device_error that the action throws, and its text.
template <typename F>
std::pair<kind, std::string> error_of(F action) {
  try {
    action();
  } catch (const device_error& error) {
    return {error.reason(), error.what()};
  }
  ADD_FAILURE() << "no device_error";
  return {};
}

TEST(device, is_private_and_comes_back_as_it_was_made) {
  temp_device made;
  device_settings changed = made.settings;
  changed.os_version = 80100;
  changed.manufacturer = "M\u00fcller \"&\" Sons";
  device::write_settings(made.path(), changed);

  device_settings read = device::read_settings(made.path());
  EXPECT_EQ(to_text(read.id), "01020304-0506-0708-090a-0b0c0d0e0f10");
  EXPECT_EQ(read.manufacturer, changed.manufacturer);
  EXPECT_EQ(read.os_version, 80100u);
  made.open();
  struct stat status {};
  for (const char* file : {"device.json", "device.key", "boot.json", "storage.db", "lock"}) {
    ASSERT_EQ(stat(made.file(file).c_str(), &status), 0) << file;
    EXPECT_EQ(status.st_mode & 07777, 0600u) << file;
  }
  ASSERT_EQ(stat(made.path().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0700u);
}

TEST(device, is_never_made_over_something) {
  temp_device made;
  std::string before = content_of(made.file("device.key"));
  EXPECT_EQ(error_of([&] { device::create(made.path() + "/", made.settings); }).first,
            kind::EXISTS);
  EXPECT_EQ(content_of(made.file("device.key")), before);
  EXPECT_EQ(error_of([&] { device::create(made.file("device.json/x"), {}); }).first, kind::IO);
  EXPECT_EQ(error_of([&] { device::open(made.path() + "/.."); }).first, kind::NOT_FOUND);
  EXPECT_FALSE(std::filesystem::exists(made.path() + "/../lock"));
  EXPECT_THROW(device::create(made.path() + "2", {.manufacturer = "a\nb"}), std::invalid_argument);
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(made.path() + "/.."), {}), 1);
}

TEST(device, a_boot_lasts_over_processes_and_ends_with_the_machine) {
  temp_device made;
  auto seed = [&] {
    auto dev = made.open();
    return std::string(dev->boot_seed().begin(), dev->boot_seed().end());
  };
  std::string first = seed();
  EXPECT_EQ(first.size(), 32u);
  EXPECT_EQ(seed(), first);

  std::string boot = content_of(made.file("boot.json"));
  std::string rebooted = boot;
  size_t id = rebooted.find("machine_boot_id\": \"") + 19;
  rebooted[id] = rebooted[id] == '0' ? '1' : '0';
  set_content(made.file("boot.json"), rebooted);
  std::string second = seed();
  EXPECT_NE(second, first);
  device::reboot(made.path());
  EXPECT_NE(seed(), second);

  // A boot that began an hour ago by the machine's clock.
  size_t digits = boot.find("boot_ms\": ") + 10;
  uint64_t began = std::stoull(boot.substr(digits));
  uint64_t hour = std::min<uint64_t>(began, 3600'000);
  set_content(made.file("boot.json"),
              boot.substr(0, digits) + std::to_string(began - hour) + "\n}\n");
  auto dev = made.open();
  EXPECT_GE(dev->system_ms(), hour);
  EXPECT_LT(dev->system_ms(), hour + 60'000);
  EXPECT_GT(dev->ree_ms(), 1'600'000'000'000u);
}

TEST(device, belongs_to_one_process_at_a_time) {
  temp_device made;
  int ready[2];
  ASSERT_EQ(pipe(ready), 0);
  pid_t holder = fork();
  if (holder == 0) {
    auto dev = made.open();
    if (write(ready[1], "x", 1) == 1) pause();
    _exit(1);
  }
  char byte = 0;
  ASSERT_EQ(read(ready[0], &byte, 1), 1);
  auto [reason, text] = error_of([&] { made.open(); });
  EXPECT_EQ(reason, kind::BUSY);
  EXPECT_NE(text.find("process " + std::to_string(holder)), std::string::npos) << text;
  EXPECT_EQ(error_of([&] { device::reboot(made.path()); }).first, kind::BUSY);
  EXPECT_EQ(error_of([&] { device::write_settings(made.path(), {}); }).first, kind::BUSY);
  EXPECT_EQ(device::read_settings(made.path()).manufacturer, made.settings.manufacturer);
  kill(holder, SIGKILL);
  waitpid(holder, nullptr, 0);
  EXPECT_NE(made.open(), nullptr);
  close(ready[0]);
  close(ready[1]);
}

TEST(device, damaged_files_are_told_and_never_a_crash) {
  temp_device made;
  made.open()->make_rpmb();
  const std::string id(64, 'a');
  const std::pair<const char*, std::string> cases[] = {
      {"device.json", ""},
      {"device.json", std::string(6000, '[')},
      {"device.json", std::string(70'000, ' ')},
      {"device.json", R"({"id":"01020304-0506-0708-090a-0b0c0d0e0f1g"})"},
      {"device.json", R"({"id":"01020304-0506-0708-090a-0b0c0d0e0f10","manufacturer":7})"},
      {"device.key", std::string(31, 'k')},
      {"device.key", std::string(33, 'k')},
      {"boot.json", R"({"boot_seed":")" + id + R"("})"},
      {"boot.json", R"({"boot_seed":"g)" + id.substr(1) + R"(","machine_boot_id":"","boot_ms":0})"},
      {"boot.json", R"({"boot_seed":")" + id + R"(","machine_boot_id":"","boot_ms":-1})"},
      {"rpmb", std::string(80, 'r')},
  };
  for (const auto& [file, content] : cases) {
    std::string good = content_of(made.file(file));
    set_content(made.file(file), content);
    auto [reason, text] = error_of([&] { made.open(); });
    EXPECT_EQ(reason, kind::DAMAGED) << file << ": " << content.substr(0, 80);
    EXPECT_NE(text.find(file), std::string::npos) << text;
    EXPECT_EQ(text.find(id.substr(1)), std::string::npos) << text;
    set_content(made.file(file), good);
  }
  EXPECT_NE(made.open(), nullptr);
}

}  // namespace
}  // namespace tee::test
