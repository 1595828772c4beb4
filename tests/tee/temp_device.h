// A device in a temporary folder, which goes with it.
#pragma once

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <stdlib.h>
#include <string>

#include "tee/device/device.h"

namespace tee::test {

class temp_device {
 public:
  explicit temp_device(bool rpmb = true) {
    // Memory where there is such a folder: a test syncs files hundreds of times.
    std::filesystem::path base = "/dev/shm";
    if (!std::filesystem::is_directory(base)) base = std::filesystem::temp_directory_path();
    std::string name = base / "device-test-XXXXXX";
    if (mkdtemp(name.data()) == nullptr) throw std::runtime_error("mkdtemp");
    root_ = name;
    settings.identity = {0x01020304, 0x0506, 0x0708, {9, 10, 11, 12, 13, 14, 15, 16}};
    settings.rpmb = rpmb;
    device::create(path(), settings);
  }
  temp_device(const temp_device&) = delete;
  temp_device& operator=(const temp_device&) = delete;
  ~temp_device() { std::filesystem::remove_all(root_); }

  std::string path() const { return root_ + "/state/device"; }
  std::string file(const char* name) const { return path() + "/" + name; }
  std::unique_ptr<device> open() const { return device::open(path()); }

  device_settings settings;

 private:
  std::string root_;
};

inline std::string content_of(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

inline void set_content(const std::string& path, const std::string& content) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << content;
}

}  // namespace tee::test
