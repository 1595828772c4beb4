// The sealed rows of the persistent objects.
#include "tee/device/object_rows.h"

#include <algorithm>

namespace tee {

namespace {

constexpr char FILE_NAME[] = "storage.db";
constexpr char SCHEMA[] =
    "CREATE TABLE objects(storage INTEGER NOT NULL, ta BLOB NOT NULL, id BLOB NOT NULL,"
    "  generation INTEGER NOT NULL, sealed BLOB NOT NULL, PRIMARY KEY(storage, ta, id));";
constexpr char DEVICE_SCHEMA[] = "CREATE TABLE device(tag BLOB NOT NULL); PRAGMA user_version=2;";
constexpr int64_t SCHEMA_VERSION = 2;
constexpr uint8_t BOUND_VERSION = 1;

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

statement& bind_name(statement* to, const object_name& name) {
  return to->bind(name.storage).bind(name.ta).bind(name.id);
}

}  // namespace

object_rows::object_rows(const device_folder& folder, const device_key& key)
    : folder_(folder),
      content_key_(derive_key(key, "object content")),
      tag_(derive_key(key, "object store of the device")) {}

void object_rows::create(const device_folder& folder, const device_key& key) {
  object_rows made(folder, key);
  folder.write(FILE_NAME, {});
  made.db_.emplace(folder.path_through(FILE_NAME));
  transaction change(&*made.db_);
  made.db_->run(SCHEMA);
  made.mark();
  change.commit();
}

// Makes the database this device's, in the present form.
void object_rows::mark() {
  db_->run(DEVICE_SCHEMA);
  statement(&*db_, "INSERT INTO device VALUES(?)").bind(tag_).step();
}

void object_rows::connect() {
  if (db_ && db_->in_place()) return;
  db_.reset();
  if (!folder_.contains(FILE_NAME)) {
    throw device_error(device_error::kind::DAMAGED, folder_.path_of(FILE_NAME) + " is missing");
  }
  database db(folder_.path_through(FILE_NAME));
  require_own(&db);
  db_.emplace(std::move(db));
}

void object_rows::require_own(database* db) const {
  const std::string path = folder_.path_of(FILE_NAME);
  statement version(db, "PRAGMA user_version");
  if (!version.step() || version.number(0) != SCHEMA_VERSION) {
    throw device_error(device_error::kind::DAMAGED, path + " is not an object store");
  }
  statement tag(db, "SELECT tag FROM device");
  if (!tag.step() || !same_mac(tag.bytes(0), tag_)) {
    throw device_error(device_error::kind::DAMAGED, path + " is another device's object store");
  }
}

std::optional<object_rows::row> object_rows::find(const object_name& name) {
  statement select(&*db_,
                   "SELECT generation, sealed FROM objects WHERE storage=? AND ta=? AND id=?");
  if (!bind_name(&select, name).step()) return std::nullopt;
  auto sealed = select.bytes(1);
  return row{static_cast<uint64_t>(select.number(0)), {sealed.begin(), sealed.end()}};
}

std::vector<object_name> object_rows::names() {
  std::vector<object_name> found;
  statement select(&*db_, "SELECT storage, ta, id FROM objects");
  while (select.step()) {
    auto ta = select.bytes(1);
    auto id = select.bytes(2);
    object_name name{static_cast<uint32_t>(select.number(0)), {}, {id.begin(), id.end()}};
    if (ta.size() != name.ta.size()) continue;  // no object's row, and never looked up
    std::copy(ta.begin(), ta.end(), name.ta.begin());
    found.push_back(std::move(name));
  }
  return found;
}

std::optional<secret_bytes> object_rows::open(const object_name& name, const row& found) const {
  return unseal(content_key_, bound_bytes(name, found.generation), found.sealed);
}

void object_rows::put(const object_name& name, uint64_t generation,
                      std::span<const uint8_t> content) {
  transaction change(&*db_);
  write(name, generation, content);
  change.commit();
}

void object_rows::write(const object_name& name, uint64_t generation,
                        std::span<const uint8_t> content) {
  const auto sealed = seal(content_key_, bound_bytes(name, generation), content);
  statement insert(&*db_, "INSERT OR REPLACE INTO objects VALUES(?,?,?,?,?)");
  bind_name(&insert, name).bind(static_cast<int64_t>(generation)).bind(sealed).step();
}

void object_rows::erase(const object_name& name) {
  transaction change(&*db_);
  statement remove(&*db_, "DELETE FROM objects WHERE storage=? AND ta=? AND id=?");
  bind_name(&remove, name).step();
  change.commit();
}

}  // namespace tee
