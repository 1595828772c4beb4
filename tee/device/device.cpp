// A device: its folder, its files, its life.
#include "tee/device/device.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <pwd.h>
#include <system_error>
#include <unistd.h>
#include <utility>

#include "tee/device/backup.h"
#include "tee/device/boot.h"
#include "tee/device/clock.h"
#include "tee/device/earlier_form.h"
#include "tee/device/folder.h"
#include "tee/device/identity.h"
#include "tee/device/json_file.h"
#include "tee/device/object_store.h"
#include "tee/device/process_mark.h"
#include "tee/device/uuid.h"

namespace tee {

namespace {

constexpr char SETTINGS_FILE[] = "device.json";
constexpr size_t SETTINGS_FILE_LIMIT = 64 * 1024;
constexpr size_t TEXT_LIMIT = 128;

std::string home_of_user() {
  std::array<char, 4096> room{};
  passwd entry{};
  passwd* found = nullptr;
  getpwuid_r(geteuid(), &entry, room.data(), room.size(), &found);
  return found != nullptr ? found->pw_dir : "";
}

bool is_plain_text(const std::string& text) {
  return text.size() <= TEXT_LIMIT && std::none_of(text.begin(), text.end(), [](char c) {
           return static_cast<unsigned char>(c) < 0x20 || c == 0x7F;
         });
}

void store_settings(const device_folder& folder, const device_settings& settings) {
  if (!is_plain_text(settings.manufacturer) || !is_plain_text(settings.implementation_version)) {
    throw std::invalid_argument(
        "a device's texts are at most 128 bytes without control characters");
  }
  json document = {{"manufacturer", settings.manufacturer},
                   {"implementation_version", settings.implementation_version},
                   {"os_version", settings.os_version},
                   {"os_patchlevel", settings.os_patchlevel}};
  try {
    folder.write(SETTINGS_FILE, as_bytes(to_file_text(document)));
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

// Whatever is fixed comes from the authenticated secrets.
device_settings parse_settings(const device_folder& folder, const device_secrets& secrets) {
  const std::string path = folder.path_of(SETTINGS_FILE);
  auto text = folder.read(SETTINGS_FILE, SETTINGS_FILE_LIMIT);
  if (!text) throw device_error(device_error::kind::DAMAGED, path + " is missing");
  json document = parse_json({reinterpret_cast<const char*>(text->data()), text->size()}, path);
  device_settings settings;
  settings.rpmb = secrets.rpmb;
  settings.public_id = public_id_of(identity_uuid(secrets));
  settings.manufacturer = checked_text(document, "manufacturer", path);
  settings.implementation_version = checked_text(document, "implementation_version", path);
  settings.os_version =
      static_cast<uint32_t>(json_number(document, "os_version", UINT32_MAX, path));
  settings.os_patchlevel =
      static_cast<uint32_t>(json_number(document, "os_patchlevel", UINT32_MAX, path));
  return settings;
}

// What a new device holds, made in a folder of its own beside the place where it is to appear.
void fill_folder(const device_folder& folder, const device_settings& settings) {
  const bool nil = same_uuid(settings.identity, TEE_UUID{});
  const device_secrets secrets = new_secrets(nil ? new_uuid() : settings.identity, settings.rpmb);
  store_settings(folder, settings);
  start_boot(folder);
  object_store::create(folder, secrets.key);
  store_identity(folder, secrets);
  store_key(folder, secrets);
}

// The folder of a device that is there, and private.
device_folder find_device(const std::string& path) {
  device_folder folder(path);
  if (!folder.has(SETTINGS_FILE) && !folder.has(KEY_FILE)) {
    throw device_error(device_error::kind::NOT_FOUND, "there is no device at " + path);
  }
  folder.require_private();
  return folder;
}

// The same, taken for this object and in the present form.
device_folder take_device(const std::string& path) {
  device_folder folder = find_device(path);
  folder.lock();
  folder.require_writable();
  if (is_earlier_form(folder)) {
    const device_secrets secrets = earlier_secrets(folder);
    const device_settings settings = parse_settings(folder, secrets);
    bring_over(folder, secrets, [&] { store_settings(folder, settings); });
  }
  return folder;
}

}  // namespace

struct device::state {
  explicit state(const std::string& path)
      : folder(take_device(path)),
        secrets(load_secrets(folder)),
        settings(parse_settings(folder, secrets)),
        objects(folder, secrets.key, secrets.rpmb),
        boot(current_boot(folder)) {
    remove_leftovers(folder);
  }

  const pid_t process = getpid();
  const process_mark opened_in;
  device_folder folder;
  device_secrets secrets;
  device_settings settings;
  object_store objects;
  boot_record boot;
};

std::string device::default_path() {
  // A program with raised rights does not use the device that its caller's environment names.
  auto variable = [](const char* name) {
    const char* value = secure_getenv(name);
    return std::string(value != nullptr ? value : "");
  };
  if (std::string path = variable("KEYMASTER_DEVICE"); !path.empty()) return path;
  std::string base = variable("XDG_STATE_HOME");
  std::string home = variable("HOME");
  if (home.empty()) home = home_of_user();
  if (base.empty()) base = home + "/.local/state";
  return base + "/keymaster/device";
}

void device::create(const std::string& path, const device_settings& settings) {
  make_device_folder(path, [&](const device_folder& draft) { fill_folder(draft, settings); });
}

device_settings device::read_settings(const std::string& path) {
  const device_folder folder = find_device(path);
  return parse_settings(folder,
                        is_earlier_form(folder) ? earlier_secrets(folder) : load_secrets(folder));
}

void device::write_settings(const std::string& path, const device_settings& settings) {
  store_settings(take_device(path), settings);
}

void device::backup(const std::string& path, const std::string& file) {
  const state opened(path);  // so that what is kept is known to be whole
  write_backup(opened.folder, opened.secrets.key, file);
}

void device::restore(const std::string& file, const std::string& path) {
  make_device_folder(path, [&](const device_folder& draft) {
    const device_key key = read_backup(file, draft);
    const device_secrets secrets = load_secrets(draft);
    parse_settings(draft, secrets);
    const object_store whole(draft, key, secrets.rpmb);  // or throws
    start_boot(draft);
  });
}

void device::reboot(const std::string& path) {
  start_boot(take_device(path));
}

std::unique_ptr<device> device::open(const std::string& path) {
  try {
    return std::unique_ptr<device>(new device(std::make_unique<state>(path)));
  } catch (const storage_error& error) {
    throw device_error(error.damaged() ? device_error::kind::DAMAGED : device_error::kind::IO,
                       path + "/storage.db: " + error.what());
  }
}

device::device(std::unique_ptr<state> open_state) : state_(std::move(open_state)) {}
device::~device() = default;

const std::string& device::path() const {
  return state_->folder.path();
}
bool device::in_own_process() const {
  return state_->opened_in.at_home();
}
void device::require_at(const std::string& path) const {
  if (!in_own_process()) {
    throw device_error(device_error::kind::BUSY, "device " + path + " is in use by process " +
                                                     std::to_string(state_->process) +
                                                     ", which this one was forked from");
  }
  if (!state_->folder.is_at(path)) {
    throw device_error(device_error::kind::BUSY, "another folder lies at " + path +
                                                     ", and the device that was opened there "
                                                     "is still open");
  }
}
const device_settings& device::settings() const {
  return state_->settings;
}
TEE_UUID device::identity() const {
  return identity_uuid(state_->secrets);
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
std::vector<damaged_object> device::check() {
  return state_->objects.check();
}
void device::forget(const object_name& name) {
  state_->objects.forget(name);
}

}  // namespace tee
