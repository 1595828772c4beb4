// The persistent objects of a device: sealed rows in SQLite, checked against the replay table.
#include "tee/device/object_store.h"

#include "tee_extensions.h"

#include <cerrno>
#include <new>

#include "tee/device/files.h"

namespace tee {

namespace {

constexpr char SCHEMA[] =
    "PRAGMA user_version=1;"
    "CREATE TABLE objects(storage INTEGER NOT NULL, ta BLOB NOT NULL, id BLOB NOT NULL,"
    "  generation INTEGER NOT NULL, sealed BLOB NOT NULL, PRIMARY KEY(storage, ta, id));"
    "CREATE TABLE quarantine(number INTEGER PRIMARY KEY, removed_at TEXT DEFAULT CURRENT_TIMESTAMP,"
    "  reason TEXT, storage INTEGER, ta BLOB, id BLOB, generation INTEGER, sealed BLOB);";
constexpr int64_t SCHEMA_VERSION = 1;
constexpr char BOUND_VERSION = 1;

// Damaged rows are kept for people to look at, the latest of them.
constexpr int64_t QUARANTINE_ROWS = 64;

// What a row's content is bound to. Only the id varies in length, so no two names look alike.
std::vector<uint8_t> bound_bytes(const object_name& name, uint64_t generation) {
  std::vector<uint8_t> bytes{BOUND_VERSION};
  for (int shift = 0; shift < 32; shift += 8) {
    bytes.push_back(static_cast<uint8_t>(name.storage >> shift));
  }
  for (int shift = 0; shift < 64; shift += 8) {
    bytes.push_back(static_cast<uint8_t>(generation >> shift));
  }
  bytes.insert(bytes.end(), name.ta.begin(), name.ta.end());
  bytes.insert(bytes.end(), name.id.begin(), name.id.end());
  return bytes;
}

TEE_Result result_of(const file_error& error) {
  bool full = error.error_number() == ENOSPC || error.error_number() == EDQUOT;
  return full ? TEE_ERROR_STORAGE_NO_SPACE : TEE_ERROR_STORAGE_NOT_AVAILABLE;
}

}  // namespace

void object_store::create(const std::string& folder) {
  database::create(folder + "/storage.db", SCHEMA);
}

object_store::object_store(const std::string& folder, const device_key& key, bool has_rpmb)
    : path_(folder + "/storage.db"),
      content_key_(derive_key(key, "object content")),
      has_rpmb_(has_rpmb),
      replay_(folder + "/rpmb", derive_key(key, "replay table")) {}

// Runs a call's work with the store to itself, connected, and lets only storage_error out.
template <typename F>
auto object_store::guarded(F action) {
  std::lock_guard lock(mutex_);
  try {
    connect();
    return action();
  } catch (const storage_error&) {
    throw;
  } catch (const file_error& error) {
    throw storage_error(result_of(error), error.what());
  } catch (const std::bad_alloc&) {
    throw storage_error(TEE_ERROR_OUT_OF_MEMORY, "object store: out of memory");
  } catch (const std::exception& error) {
    throw storage_error(TEE_ERROR_STORAGE_NOT_AVAILABLE, error.what());
  }
}

// A connection whose file was taken away would go on writing into nothing, so that is looked at
// anew in every call.
void object_store::connect() {
  if (db_ && db_->in_place()) return;
  db_.reset();
  database db(path_);
  statement version(&db, "PRAGMA user_version");
  if (!version.step() || version.number(0) != SCHEMA_VERSION) {
    throw storage_error(TEE_ERROR_STORAGE_NOT_AVAILABLE, path_ + " is not an object store");
  }
  db_.emplace(std::move(db));
}

// The replay table that guards the object, with nothing pending in it; null when none does.
replay_table* object_store::table_of(const object_name& name) {
  if (name.storage == TEE_STORAGE_PRIVATE) return nullptr;
  if (name.storage != TEE_STORAGE_RPMB || !has_rpmb_ || !replay_.exists()) {
    throw storage_error(TEE_ERROR_ITEM_NOT_FOUND, "object store: no such storage");
  }
  settle_pending();
  return &replay_;
}

void object_store::settle_pending() {
  const object_name* pending = replay_.pending();
  if (pending == nullptr) return;
  auto found = find_row(*pending);
  replay_.settle(found ? static_cast<uint64_t>(found->generation) : 0);
}

std::optional<object_store::row> object_store::find_row(const object_name& name) {
  statement select(&*db_,
                   "SELECT generation, sealed FROM objects WHERE storage=? AND ta=? AND id=?");
  select.bind(name.storage).bind(name.ta).bind(name.id);
  if (!select.step()) return std::nullopt;
  auto sealed = select.bytes(1);
  return row{select.number(0), {sealed.begin(), sealed.end()}};
}

template <typename F>
void object_store::change(const object_name& name, bool present, F write) {
  replay_table* table = table_of(name);
  uint64_t generation = table != nullptr ? table->prepare(name, present) : 0;
  transaction rows(&*db_);
  write(generation);
  rows.commit();
  if (table != nullptr) settle_pending();
}

void object_store::make_rpmb() {
  guarded([&] {
    if (!has_rpmb_) throw storage_error(TEE_ERROR_ITEM_NOT_FOUND, "object store: no such storage");
    replay_.make();
  });
}

std::optional<secret_bytes> object_store::load(const object_name& name) {
  return guarded([&]() -> std::optional<secret_bytes> {
    replay_table* table = table_of(name);
    uint64_t generation = table != nullptr ? table->generation_of(name) : 0;
    auto found = find_row(name);
    if (!found && generation == 0) return std::nullopt;
    if (!found) quarantine(name, "its row is missing");
    if (static_cast<uint64_t>(found->generation) != generation) {
      quarantine(name, "its row is of another generation");
    }
    auto content = unseal(content_key_, bound_bytes(name, generation), found->sealed);
    if (!content) quarantine(name, "its row is not authentic");
    return content;
  });
}

void object_store::save(const object_name& name, std::span<const uint8_t> content) {
  guarded([&] {
    change(name, true, [&](uint64_t generation) {
      auto sealed = seal(content_key_, bound_bytes(name, generation), content);
      statement(&*db_, "INSERT OR REPLACE INTO objects VALUES(?,?,?,?,?)")
          .bind(name.storage)
          .bind(name.ta)
          .bind(name.id)
          .bind(static_cast<int64_t>(generation))
          .bind(sealed)
          .step();
    });
  });
}

void object_store::remove(const object_name& name) {
  guarded([&] { change(name, false, [&](uint64_t) { delete_row(name); }); });
}

void object_store::delete_row(const object_name& name) {
  statement(&*db_, "DELETE FROM objects WHERE storage=? AND ta=? AND id=?")
      .bind(name.storage)
      .bind(name.ta)
      .bind(name.id)
      .step();
}

// Takes an object that did not open out of the store and reports it. When it cannot be taken out it
// is still corrupt, and will be found so again.
void object_store::quarantine(const object_name& name, const std::string& reason) {
  std::string remark;
  try {
    change(name, false, [&](uint64_t) {
      statement(&*db_,
                "INSERT INTO quarantine(reason, storage, ta, id, generation, sealed) SELECT ?, *"
                " FROM objects WHERE storage=? AND ta=? AND id=?")
          .bind(reason)
          .bind(name.storage)
          .bind(name.ta)
          .bind(name.id)
          .step();
      delete_row(name);
      statement(&*db_,
                "DELETE FROM quarantine WHERE number <= (SELECT max(number) FROM quarantine) - ?")
          .bind(QUARANTINE_ROWS)
          .step();
    });
  } catch (const std::exception& error) {
    remark = std::string("; not removed: ") + error.what();
  }
  throw storage_error(TEE_ERROR_CORRUPT_OBJECT, "object store: corrupt object, " + reason + remark);
}

}  // namespace tee
