// A thin layer over SQLite.
#include "tee/device/database.h"

#include <cerrno>
#include <cstring>

namespace tee {

namespace {

// How long another program that looks at the database may hold it.
constexpr int BUSY_TIMEOUT_MS = 200;

// A commit truncates the rollback journal and syncs it, so that a power cut right after it cannot
// bring the journal, and with it the old state, back.
constexpr char CONNECTION_SETTINGS[] =
    "PRAGMA journal_mode=TRUNCATE; PRAGMA synchronous=FULL; PRAGMA secure_delete=ON;"
    "PRAGMA trusted_schema=OFF; PRAGMA temp_store=MEMORY;";

bool is_full(int code, int error_number) {
  if ((code & 0xFF) == SQLITE_FULL) return true;
  return (code & 0xFF) == SQLITE_IOERR &&
         (error_number == ENOSPC || error_number == EDQUOT || error_number == EFBIG);
}

// The library's own view of files, but with paths left as they are: it would follow the links in
// them once, and keep its journal where they led to then, even after the folder was moved.
const char* plain_paths() {
  static sqlite3_vfs vfs = [] {
    sqlite3_vfs made = *sqlite3_vfs_find(nullptr);
    made.zName = "plain-paths";
    made.xFullPathname = [](sqlite3_vfs*, const char* path, int room, char* out) {
      if (std::strlen(path) >= static_cast<size_t>(room)) return SQLITE_CANTOPEN;
      std::strcpy(out, path);
      return SQLITE_OK;
    };
    return made;
  }();
  static const int REGISTERED = sqlite3_vfs_register(&vfs, 0);
  return REGISTERED == SQLITE_OK ? vfs.zName : nullptr;
}

}  // namespace

database::database(const std::string& path) {
  sqlite3* handle = nullptr;
  int code = sqlite3_open_v2(path.c_str(), &handle, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX,
                             plain_paths());
  handle_.reset(handle);
  if (code != SQLITE_OK) fail();
  sqlite3_extended_result_codes(handle, 1);
  sqlite3_busy_timeout(handle, BUSY_TIMEOUT_MS);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_TRIGGER, 0, nullptr);
  sqlite3_db_config(handle, SQLITE_DBCONFIG_ENABLE_VIEW, 0, nullptr);
  run(CONNECTION_SETTINGS);
  if (sqlite3_db_readonly(handle, "main") != 0) {
    throw storage_error(TEE_ERROR_STORAGE_NOT_AVAILABLE, "object store: it cannot be written");
  }
}

bool database::in_place() const {
  int moved = 0;
  return sqlite3_file_control(handle(), "main", SQLITE_FCNTL_HAS_MOVED, &moved) == SQLITE_OK &&
         moved == 0;
}

void database::run(const char* sql) {
  if (sqlite3_exec(handle(), sql, nullptr, nullptr, nullptr) != SQLITE_OK) fail();
}

void database::fail() const {
  if (!handle_) throw storage_error(TEE_ERROR_OUT_OF_MEMORY, "out of memory");
  int code = sqlite3_extended_errcode(handle());
  TEE_Result result = TEE_ERROR_STORAGE_NOT_AVAILABLE;
  if (is_full(code, sqlite3_system_errno(handle()))) result = TEE_ERROR_STORAGE_NO_SPACE;
  if (code == SQLITE_NOMEM) result = TEE_ERROR_OUT_OF_MEMORY;
  throw storage_error(
      result,
      std::string("object store: ") + sqlite3_errmsg(handle()) + " (" + std::to_string(code) + ")",
      (code & 0xFF) == SQLITE_NOTADB || (code & 0xFF) == SQLITE_CORRUPT);
}

statement::statement(database* db, const char* sql) : db_(db) {
  sqlite3_stmt* handle = nullptr;
  int code = sqlite3_prepare_v2(db->handle(), sql, -1, &handle, nullptr);
  handle_.reset(handle);
  check(code);
}

void statement::check(int code) const {
  if (code != SQLITE_OK) db_->fail();
}

statement& statement::bind(int64_t value) {
  check(sqlite3_bind_int64(handle_.get(), ++bound_, value));
  return *this;
}

statement& statement::bind(std::span<const uint8_t> bytes) {
  // A null pointer would bind NULL, which is not the empty string of bytes.
  const void* data = bytes.empty() ? "" : static_cast<const void*>(bytes.data());
  check(sqlite3_bind_blob64(handle_.get(), ++bound_, data, bytes.size(), SQLITE_STATIC));
  return *this;
}

statement& statement::bind(const std::string& text) {
  check(sqlite3_bind_text64(handle_.get(), ++bound_, text.data(), text.size(), SQLITE_STATIC,
                            SQLITE_UTF8));
  return *this;
}

bool statement::step() {
  int code = sqlite3_step(handle_.get());
  if (code != SQLITE_ROW && code != SQLITE_DONE) db_->fail();
  return code == SQLITE_ROW;
}

int64_t statement::number(int column) const {
  return sqlite3_column_int64(handle_.get(), column);
}

std::span<const uint8_t> statement::bytes(int column) const {
  const void* data = sqlite3_column_blob(handle_.get(), column);
  int length = sqlite3_column_bytes(handle_.get(), column);
  if (data == nullptr) return {};
  return {static_cast<const uint8_t*>(data), static_cast<size_t>(length)};
}

transaction::transaction(database* db) : db_(db) {
  db_->run("BEGIN IMMEDIATE");
}

void transaction::commit() {
  db_->run("COMMIT");
  open_ = false;
}

transaction::~transaction() {
  // Nothing is left to roll back when the failure already did it; its code says no more than ours.
  if (open_) sqlite3_exec(db_->handle(), "ROLLBACK", nullptr, nullptr, nullptr);
}

}  // namespace tee
