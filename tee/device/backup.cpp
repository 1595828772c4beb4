// Backups of a device.
#include "tee/device/backup.h"

#include <algorithm>
#include <cerrno>
#include <unistd.h>

#include "tee/device/identity.h"
#include "tee/device/os_open.h"
#include "tee/device/table_bytes.h"

namespace tee {

namespace {

constexpr std::string_view HEADER("KMBK\1\0\0\0", 8);
constexpr const char* FILES[] = {KEY_FILE, "identity", "device.json", "replay", "storage.db"};
constexpr size_t LIMIT = size_t{1} << 30;

mac_bytes backup_mac(const device_key& key, std::span<const uint8_t> bytes) {
  return compute_mac(derive_key(key, "device backup"), bytes);
}

[[noreturn]] void throw_damaged(const std::string& file, const char* how) {
  throw device_error(device_error::kind::DAMAGED, file + how);
}

void write_new_file(const std::string& file, std::span<const uint8_t> bytes) {
  file_descriptor out(os::open_file(file.c_str(), os::open_mode::CREATE));
  if (!out && errno == EEXIST) {
    throw device_error(device_error::kind::EXISTS, file + " exists already");
  }
  if (!out) throw file_error("create", file);
  try {
    write_all(out, bytes, file);
    if (fsync(out.get()) != 0) throw file_error("sync", file);
  } catch (...) {
    unlink(file.c_str());
    throw;
  }
  sync_parent(file);
}

}  // namespace

void write_backup(const device_folder& folder, const device_key& key, const std::string& file) {
  secret_bytes bytes(HEADER.begin(), HEADER.end());
  for (const char* name : FILES) {
    const auto content = folder.read(name, LIMIT);
    if (!content) throw_damaged(folder.path_of(name), " is missing");
    append_number(&bytes, uint64_t{content->size()});
    bytes.insert(bytes.end(), content->begin(), content->end());
  }
  const mac_bytes mac = backup_mac(key, bytes);
  bytes.insert(bytes.end(), mac.begin(), mac.end());
  write_new_file(file, bytes);
}

device_key read_backup(const std::string& file, const device_folder& folder) {
  const auto content = read_file(file, LIMIT);
  if (!content) {
    throw device_error(device_error::kind::NOT_FOUND, "there is no backup " + file);
  }
  table_reader reader(*content);
  const auto header = reader.bytes(HEADER.size());
  if (!header || !std::ranges::equal(*header, as_bytes(HEADER))) {
    throw_damaged(file, " is not a backup of a device");
  }
  for (const char* name : FILES) {
    const auto length = reader.number<uint64_t>();
    const bool fits = length && *length <= content->size();
    const auto bytes = fits ? reader.bytes(static_cast<size_t>(*length)) : std::nullopt;
    if (!bytes) throw_damaged(file, " is cut off");
    folder.write(name, *bytes);
  }
  const auto mac = reader.bytes(sizeof(mac_bytes));
  device_key key = load_secrets(folder).key;
  const auto covered = std::span(*content).first(content->size() - sizeof(mac_bytes));
  if (!mac || !reader.done() || !same_mac(*mac, backup_mac(key, covered))) {
    throw_damaged(file, " is not authentic");
  }
  return key;
}

}  // namespace tee
