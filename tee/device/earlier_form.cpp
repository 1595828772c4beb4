// Device folders of the earlier form.
#include "tee/device/earlier_form.h"

#include "tee_extensions.h"

#include "tee/device/json_file.h"
#include "tee/device/object_rows.h"
#include "tee/device/replay_table.h"
#include "tee/device/table_bytes.h"
#include "tee/device/uuid.h"

namespace tee {

namespace {

constexpr char MADE_IDENTITY[] = "identity";
constexpr char EARLIER_SETTINGS[] = "device.json";
constexpr char EARLIER_TABLE[] = "rpmb";
constexpr char EARLIER_LOCK[] = "lock";
constexpr size_t EARLIER_LIMIT = 16 * 1024 * 1024;

[[noreturn]] void throw_damaged(const device_folder& folder, const std::string& name,
                                const char* how) {
  throw device_error(device_error::kind::DAMAGED, folder.path_of(name) + how);
}

}  // namespace

// Reads what the earlier form holds into the structures of the present one.
class earlier_form {
 public:
  earlier_form(const device_folder& folder, const device_secrets& secrets)
      : folder_(folder), secrets_(secrets), rows_(folder, secrets.key) {}

  void bring_storage_over() {
    read_table();
    if (!folder_.contains("storage.db")) throw_damaged(folder_, "storage.db", " is missing");
    rows_.db_.emplace(folder_.path_through("storage.db"));
    statement version(&*rows_.db_, "PRAGMA user_version");
    const int64_t form = version.step() ? version.number(0) : 0;
    if (form != 1 && form != 2) throw_damaged(folder_, "storage.db", " is not an object store");
    if (form == 2) rows_.require_own(&*rows_.db_);
    transaction change(&*rows_.db_);
    for (const object_name& name : rows_.names())
      take_over(name);
    if (refused_ > 0 && taken_ == 0) throw_damaged(folder_, KEY_FILE, " is not the device's key");
    if (form == 1) rows_.mark();
    change.commit();
    replay_table::store(folder_, replay_table::mac_key(secrets_.key), table_);
  }

 private:
  // "KMRT", u32 form (1), u64 counter, u32 count, count entries, u32 number of pending entries (0
  // or 1), that entry, HMAC-SHA256 of all before. Entry: TA, u8 id length, id, u64 generation.
  void read_table() {
    auto file = folder_.read(EARLIER_TABLE, EARLIER_LIMIT);
    if (!file) return;
    has_table_ = true;
    const std::span<const uint8_t> bytes = *file;
    const size_t length = bytes.size() - std::min(bytes.size(), sizeof(mac_bytes));
    const mac_bytes mac = compute_mac(replay_table::mac_key(secrets_.key), bytes.first(length));
    table_reader reader(bytes.first(length));
    const auto start = reader.bytes(8);
    const auto counter = reader.number<uint64_t>();
    if (!same_mac(mac, bytes.subspan(length)) || !start || (*start)[4] != 1 || !counter) {
      throw_damaged(folder_, EARLIER_TABLE, " is not authentic");
    }
    table_.counter = *counter;
    read_entries(&reader, [](replay_entry* entry, uint64_t value) { entry->current = value; });
    read_entries(&reader, [](replay_entry* entry, uint64_t value) { entry->next = value; });
  }

  template <typename F>
  void read_entries(table_reader* reader, F put) {
    const uint32_t count = reader->number<uint32_t>().value_or(0);
    for (uint32_t i = 0; i < count; i++) {
      auto name = reader->name(TEE_STORAGE_RPMB);
      auto generation = reader->number<uint64_t>();
      if (!name || !generation) throw_damaged(folder_, EARLIER_TABLE, " is malformed");
      put(&table_.objects[*name], *generation);
    }
  }

  // Private rows had generation 0. One that is authentic gets one; for another the table demands a
  // generation that it does not have.
  void take_over(const object_name& name) {
    if (name.storage == TEE_STORAGE_RPMB) {
      if (!has_table_) throw_damaged(folder_, EARLIER_TABLE, ", the replay table, is missing");
      return;
    }
    const auto row = rows_.find(name);
    const auto content = rows_.open(name, *row);
    const bool moved = row->generation != 0;  // before this was cut off
    table_.counter = std::max(table_.counter, moved ? row->generation : 0) + 1;
    const uint64_t generation = content && moved ? row->generation : table_.counter;
    table_.objects[name].current = generation;
    if (content && !moved) rows_.write(name, generation, *content);
    (content ? taken_ : refused_)++;
  }

  const device_folder& folder_;
  const device_secrets& secrets_;
  object_rows rows_;
  bool has_table_ = false;
  size_t taken_ = 0;
  size_t refused_ = 0;
  replay_table::content table_;
};

bool is_earlier_form(const device_folder& folder) {
  auto key = folder.read(KEY_FILE, EARLIER_LIMIT);
  return key && key->size() == DEVICE_KEY_LENGTH;
}

device_secrets earlier_secrets(const device_folder& folder) {
  auto key = folder.read(KEY_FILE, DEVICE_KEY_LENGTH);
  if (!key) throw_damaged(folder, KEY_FILE, " is missing");
  if (folder.contains(MADE_IDENTITY)) return load_identity(folder, std::move(*key));
  const std::string path = folder.path_of(EARLIER_SETTINGS);
  auto text = folder.read(EARLIER_SETTINGS, EARLIER_LIMIT);
  if (!text) throw_damaged(folder, EARLIER_SETTINGS, " is missing");
  json document = parse_json({reinterpret_cast<const char*>(text->data()), text->size()}, path);
  TEE_UUID identity{};
  if (!parse_uuid(json_text(document, "id", path), &identity)) {
    throw_damaged(folder, EARLIER_SETTINGS, ": id is not a UUID");
  }
  device_secrets secrets = new_secrets(identity, json_flag(document, "rpmb", path));
  secrets.key = std::move(*key);
  return secrets;
}

void bring_over(const device_folder& folder, const device_secrets& secrets,
                const std::function<void()>& store_settings) {
  const auto earlier_lock = folder.lock_file(EARLIER_LOCK);
  earlier_form(folder, secrets).bring_storage_over();
  store_identity(folder, secrets);
  store_settings();
  store_key(folder, secrets);
}

void remove_leftovers(const device_folder& folder) {
  for (const char* name : {EARLIER_TABLE, EARLIER_LOCK}) {
    if (folder.has(name)) folder.remove(name);
  }
}

}  // namespace tee
