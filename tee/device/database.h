// A thin layer over SQLite: connection, statement, transaction. Every failure becomes
// storage_error.
#pragma once

#include "tee_internal_api.h"

#include <cstdint>
#include <memory>
#include <span>
#include <sqlite3.h>
#include <stdexcept>
#include <string>
#include <vector>

namespace tee {

// Storage failed: result() is what the trusted application gets, what() is for people.
class storage_error : public std::runtime_error {
 public:
  storage_error(TEE_Result result, const std::string& what, bool damaged = false)
      : std::runtime_error(what), result_(result), damaged_(damaged) {}
  TEE_Result result() const { return result_; }
  bool damaged() const { return damaged_; }  // the file is no database, or a broken one

 private:
  TEE_Result result_;
  bool damaged_;
};

class database {
 public:
  // Opens the file `path`, which may be empty, to read and write. STORAGE_NOT_AVAILABLE when it
  // cannot. Links in the path are followed anew whenever a file beside it is needed.
  explicit database(const std::string& path);

  // in_place: the file that was opened still stands at its path.
  bool in_place() const;

  // run: executes statements that take nothing and give nothing.
  void run(const char* sql);

  // fail: throws what the last failure means: TEE_ERROR_STORAGE_NO_SPACE, TEE_ERROR_OUT_OF_MEMORY,
  // or TEE_ERROR_STORAGE_NOT_AVAILABLE for everything else.
  [[noreturn]] void fail() const;

  sqlite3* handle() const { return handle_.get(); }

 private:
  struct closer {
    void operator()(sqlite3* handle) const { sqlite3_close(handle); }
  };
  std::unique_ptr<sqlite3, closer> handle_;
};

// One prepared statement; parameters count from 1, columns from 0. Bound bytes must outlive it.
class statement {
 public:
  statement(database* db, const char* sql);
  statement& bind(int64_t value);
  statement& bind(std::span<const uint8_t> bytes);
  statement& bind(const std::string& text);
  bool step();  // true: a row is there
  int64_t number(int column) const;
  std::span<const uint8_t> bytes(int column) const;  // valid until the next step

 private:
  struct finalizer {
    void operator()(sqlite3_stmt* handle) const { sqlite3_finalize(handle); }
  };
  void check(int code) const;
  database* db_;
  std::unique_ptr<sqlite3_stmt, finalizer> handle_;
  int bound_ = 0;
};

// A write transaction; rolled back unless committed.
class transaction {
 public:
  explicit transaction(database* db);
  transaction(const transaction&) = delete;
  transaction& operator=(const transaction&) = delete;
  ~transaction();
  void commit();

 private:
  database* db_;
  bool open_ = true;
};

}  // namespace tee
