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
  // printf 'public id of a device' | openssl mac -digest SHA256 -macopt hexkey:0102...10 HMAC
  EXPECT_EQ(to_text(read.public_id), "9b37a559-7ca9-8a59-85c8-4a4712cebb78");
  EXPECT_TRUE(same_uuid(read.identity, TEE_UUID{}));
  EXPECT_EQ(read.manufacturer, changed.manufacturer);
  EXPECT_EQ(read.os_version, 80100u);
  EXPECT_EQ(to_text(made.open()->identity()), "01020304-0506-0708-090a-0b0c0d0e0f10");
  struct stat status {};
  for (const auto& file : std::filesystem::directory_iterator(made.path())) {
    ASSERT_EQ(stat(file.path().c_str(), &status), 0) << file;
    EXPECT_EQ(status.st_mode & 07777, 0600u) << file;
    const std::string content = content_of(file.path());
    EXPECT_EQ(content.find("\1\2\3\4\5\6\7") != std::string::npos,
              file.path().filename() == "identity");
    EXPECT_EQ(content.find("01020304"), std::string::npos) << file;
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
  for (const std::string& name : {std::string("a\nb"), std::string("\x7f"), std::string(129, 'm')})
    EXPECT_THROW(device::create(made.path() + "2", {.manufacturer = name}), std::invalid_argument);
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
  const auto set_boot_ms = [&](uint64_t ms) {
    set_content(made.file("boot.json"), boot.substr(0, digits) + std::to_string(ms) + "\n}\n");
  };
  set_boot_ms(began - hour);
  auto dev = made.open();
  EXPECT_GE(dev->system_ms(), hour);
  EXPECT_LT(dev->system_ms(), hour + 60'000);
  EXPECT_GT(dev->ree_ms(), 1'600'000'000'000u);
  dev.reset();
  // And one that has not begun yet: that was another machine start.
  set_boot_ms(began + 3600'000);
  EXPECT_NE(seed(), first);
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
  temp_device other;
  const std::string id(64, 'a');
  std::string without_rpmb = content_of(made.file("identity"));
  without_rpmb[8] = 0;
  const std::pair<const char*, std::string> cases[] = {
      {"device.json", ""},
      {"device.json", std::string(6000, '[')},
      {"device.json", std::string(70'000, ' ')},
      {"device.json", R"({"manufacturer":7})"},
      {"device.key", std::string(31, 'k')},
      {"device.key", std::string(32, 'k')},
      {"device.key", content_of(other.file("device.key"))},
      {"identity", without_rpmb},
      {"identity", content_of(other.file("identity"))},
      {"boot.json", R"({"boot_seed":")" + id + R"("})"},
      {"boot.json", R"({"boot_seed":"g)" + id.substr(1) + R"(","machine_boot_id":"","boot_ms":0})"},
      {"boot.json", R"({"boot_seed":")" + id + R"(","machine_boot_id":"","boot_ms":-1})"},
      {"replay", ""},
      {"replay", "r"},
      {"replay", std::string(31, 'r')},
      {"replay", std::string(80, 'r')},
      {"replay", content_of(other.file("replay"))},
      {"storage.db", ""},
      {"storage.db", std::string(8192, 's')},
      {"storage.db", content_of(made.file("storage.db")).substr(0, 4096)},
      {"storage.db", content_of(other.file("storage.db"))},
  };
  for (const auto& [file, content] : cases) {
    std::string good = content_of(made.file(file));
    set_content(made.file(file), content);
    auto [reason, text] = error_of([&] { made.open(); });
    EXPECT_EQ(reason, kind::DAMAGED) << file << ": " << content.substr(0, 80);
    EXPECT_NE(text.find(file), std::string::npos) << text;
    EXPECT_EQ(text.find(id.substr(1)), std::string::npos) << text;
    EXPECT_EQ(content_of(made.file(file)), content);
    set_content(made.file(file), good);
    EXPECT_NE(made.open(), nullptr);
  }
}

// What is not there is missed, alone or together with what would tell of it.
TEST(device, lost_files_are_told_and_not_made_anew) {
  using files = std::vector<const char*>;
  const files cases[] = {
      {"replay"},
      {"storage.db"},
      {"replay", "storage.db"},
      {"identity"},
      {"device.key"},
      {"boot.json"},
      {"device.json"},
      {"identity", "replay", "storage.db"},
  };
  for (const files& lost : cases) {
    temp_device made;
    for (const char* file : lost)
      std::filesystem::rename(made.file(file), made.path() + "/../" + file);
    auto [reason, text] = error_of([&] { made.open(); });
    EXPECT_EQ(reason, kind::DAMAGED) << text;
    EXPECT_NE(text.find("is missing"), std::string::npos) << text;
    for (const char* file : lost) {
      EXPECT_FALSE(std::filesystem::exists(made.file(file))) << file;
      std::filesystem::rename(made.path() + "/../" + file, made.file(file));
    }
    EXPECT_NE(made.open(), nullptr);
  }
}

TEST(device, is_refused_when_others_could_have_a_part_in_it) {
  temp_device made;
  const std::tuple<const char*, mode_t, mode_t> cases[] = {
      {"", 0750, 0700},           {"", 0701, 0700},           {"device.key", 0640, 0600},
      {"identity", 0604, 0600},   {"replay", 0620, 0600},     {"boot.json", 0644, 0600},
      {"storage.db", 0666, 0600}, {"device.json", 0602, 0600}};
  for (const auto& [file, open, closed] : cases) {
    chmod(made.file(file).c_str(), open);
    auto [reason, text] = error_of([&] { made.open(); });
    EXPECT_EQ(reason, kind::EXPOSED) << file;
    EXPECT_NE(text.find("chmod " + std::string(*file == 0 ? "700" : "600")), std::string::npos);
    chmod(made.file(file).c_str(), closed);
  }
  std::filesystem::rename(made.file("device.key"), made.path() + "/../key");
  std::filesystem::create_symlink("../key", made.file("device.key"));
  EXPECT_EQ(error_of([&] { made.open(); }).first, kind::IO);
}

// Another owner, and a folder in which nothing can be written.
TEST(device, is_refused_to_who_does_not_own_it_or_cannot_write) {
  if (geteuid() != 0) GTEST_SKIP() << "takes the rights to change owners";
  constexpr uid_t NOBODY = 65534;
  temp_device made;
  ASSERT_EQ(chown(made.path().c_str(), NOBODY, NOBODY), 0);
  EXPECT_EQ(error_of([&] { made.open(); }).first, kind::EXPOSED);
  for (const auto& entry : std::filesystem::recursive_directory_iterator(made.path() + "/../.."))
    ASSERT_EQ(chown(entry.path().c_str(), NOBODY, NOBODY), 0);
  ASSERT_EQ(chown((made.path() + "/../..").c_str(), NOBODY, NOBODY), 0);
  ASSERT_EQ(chmod(made.path().c_str(), 0500), 0);
  ASSERT_EQ(seteuid(NOBODY), 0);
  auto [reason, text] = error_of([&] { made.open(); });
  chmod(made.path().c_str(), 0700);
  EXPECT_NE(made.open(), nullptr);
  ASSERT_EQ(seteuid(0), 0);
  EXPECT_EQ(reason, kind::IO);
  EXPECT_NE(text.find("cannot write"), std::string::npos) << text;
}

}  // namespace
}  // namespace tee::test
