// A device: its folder, its files, its life.
#include "tee/device/device.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

#include "tee/device/boot.h"
#include "tee/device/clock.h"
#include "tee/device/files.h"
#include "tee/device/folder_lock.h"
#include "tee/device/json_file.h"
#include "tee/device/object_store.h"
#include "tee/device/sealing.h"
#include "tee/device/uuid.h"

namespace tee {

namespace {

constexpr size_t SETTINGS_FILE_LIMIT = 64 * 1024;
constexpr size_t TEXT_LIMIT = 128;

std::string settings_path(const std::string& folder) {
  return folder + "/device.json";
}
std::string key_path(const std::string& folder) {
  return folder + "/device.key";
}

bool is_plain_text(const std::string& text) {
  return text.size() <= TEXT_LIMIT && std::none_of(text.begin(), text.end(), [](char c) {
           return static_cast<unsigned char>(c) < 0x20 || c == 0x7F;
         });
}

void store_settings(const std::string& folder, const device_settings& settings) {
  if (!is_plain_text(settings.manufacturer) || !is_plain_text(settings.implementation_version)) {
    throw std::invalid_argument(
        "a device's texts are at most 128 bytes without control characters");
  }
  json document = {{"id", to_text(settings.id)},
                   {"manufacturer", settings.manufacturer},
                   {"implementation_version", settings.implementation_version},
                   {"rpmb", settings.rpmb},
                   {"os_version", settings.os_version},
                   {"os_patchlevel", settings.os_patchlevel}};
  try {
    write_file(settings_path(folder), as_bytes(to_file_text(document)));
  } catch (const json::exception&) {
    throw std::invalid_argument("a device's texts are UTF-8");
  }
}

std::string checked_text(const json& document, const char* name, const std::string& path) {
  std::string text = json_text(document, name, path);
  if (is_plain_text(text)) return text;
  throw device_error(device_error::kind::DAMAGED,
                     path + ": " + name + " is too long or holds control characters");
}

// What a new device holds, made in a folder of its own beside the place where it is to appear.
void fill_folder(const std::string& folder, const device_settings& settings) {
  secret_bytes key(DEVICE_KEY_LENGTH);
  fill_random(key);
  write_file(key_path(folder), key);
  store_settings(folder, settings);
  start_boot(folder);
  object_store::create(folder);
  const std::string database = folder + "/storage.db";
  if (chmod(database.c_str(), 0600) != 0) throw file_error("protect", database);
  sync_folder(folder);
}

void move_into_place(const std::string& draft, const std::string& folder) {
  if (std::rename(draft.c_str(), folder.c_str()) != 0) {
    if (errno == ENOTEMPTY || errno == EEXIST || errno == ENOTDIR) {
      throw device_error(device_error::kind::EXISTS, folder + " exists already");
    }
    throw file_error("create", folder);
  }
  sync_folder(std::filesystem::path(folder).parent_path());
}

// The path without what does not change it, such as a slash at its end.
std::string tidy(const std::string& path) {
  std::filesystem::path tidied = std::filesystem::path(path).lexically_normal();
  return tidied.has_filename() ? tidied : tidied.parent_path();
}

}  // namespace

struct device::state {
  explicit state(const std::string& folder)
      : path(folder),
        lock(folder),
        settings(read_settings(folder)),
        boot(current_boot(folder)),
        objects(folder, read_key(folder), settings.rpmb) {}

  static device_key read_key(const std::string& folder) {
    auto key = read_file(key_path(folder), DEVICE_KEY_LENGTH);
    if (key && key->size() == DEVICE_KEY_LENGTH) return *key;
    throw device_error(device_error::kind::DAMAGED, key_path(folder) + " holds no device key");
  }

  std::string path;
  folder_lock lock;
  device_settings settings;
  boot_record boot;
  object_store objects;
};

std::string device::default_path() {
  auto variable = [](const char* name) {
    const char* value = std::getenv(name);
    return std::string(value != nullptr ? value : "");
  };
  if (std::string path = variable("KEYMASTER_DEVICE"); !path.empty()) return path;
  std::string base = variable("XDG_STATE_HOME");
  if (base.empty()) base = variable("HOME") + "/.local/state";
  return base + "/keymaster/device";
}

void device::create(const std::string& path, const device_settings& settings) {
  const std::string folder = tidy(path);
  std::error_code failed;
  std::filesystem::path parent = std::filesystem::path(folder).parent_path();
  if (!parent.empty()) std::filesystem::create_directories(parent, failed);
  std::string draft = folder + ".new-XXXXXX";
  if (mkdtemp(draft.data()) == nullptr) throw file_error("create", folder);
  try {
    fill_folder(draft, settings);
    move_into_place(draft, folder);
  } catch (...) {
    std::filesystem::remove_all(draft, failed);
    throw;
  }
}

device_settings device::read_settings(const std::string& folder) {
  const std::string path = settings_path(folder);
  auto text = read_file(path, SETTINGS_FILE_LIMIT);
  if (!text) throw device_error(device_error::kind::NOT_FOUND, "there is no device at " + folder);
  json document = parse_json({reinterpret_cast<const char*>(text->data()), text->size()}, path);
  device_settings settings;
  if (!parse_uuid(json_text(document, "id", path), &settings.id)) {
    throw device_error(device_error::kind::DAMAGED, path + ": id is not a UUID");
  }
  settings.manufacturer = checked_text(document, "manufacturer", path);
  settings.implementation_version = checked_text(document, "implementation_version", path);
  settings.rpmb = json_flag(document, "rpmb", path);
  settings.os_version =
      static_cast<uint32_t>(json_number(document, "os_version", UINT32_MAX, path));
  settings.os_patchlevel =
      static_cast<uint32_t>(json_number(document, "os_patchlevel", UINT32_MAX, path));
  return settings;
}

// Locking would leave a lock file in a folder that is no device, so the settings are looked at
// first.

void device::write_settings(const std::string& path, const device_settings& settings) {
  read_settings(path);
  folder_lock lock(path);
  store_settings(path, settings);
}

void device::reboot(const std::string& path) {
  read_settings(path);
  folder_lock lock(path);
  start_boot(path);
}

std::unique_ptr<device> device::open(const std::string& path) {
  read_settings(path);
  return std::unique_ptr<device>(new device(std::make_unique<state>(path)));
}

device::device(std::unique_ptr<state> open_state) : state_(std::move(open_state)) {}
device::~device() = default;

const std::string& device::path() const {
  return state_->path;
}
const device_settings& device::settings() const {
  return state_->settings;
}

std::span<const uint8_t, device::BOOT_SEED_LENGTH> device::boot_seed() const {
  return std::span<const uint8_t, BOOT_SEED_LENGTH>(state_->boot.seed.data(), BOOT_SEED_LENGTH);
}

uint64_t device::system_ms() const {
  return system_clock_ms(state_->boot.boot_ms);
}
uint64_t device::ree_ms() const {
  return ree_clock_ms();
}
object_store& device::objects() {
  return state_->objects;
}
bool device::has_rpmb() const {
  return state_->settings.rpmb;
}

bool device::make_rpmb() noexcept {
  try {
    state_->objects.make_rpmb();
    return true;
  } catch (const std::exception&) {
    return false;
  }
}

}  // namespace tee
