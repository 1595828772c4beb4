// The persistent objects of a device: sealed rows in the SQLite database storage.db.
//
// A row carries storage id, TA, object id and generation in clear; its content is sealed under a
// key of the device with these bound in, so an edited or swapped row does not open. Rows of the
// replay-protected storage are also held against the replay table, so an old copy of a row, or of
// the whole database, does not open either, and a row that was taken away is missed.
#pragma once

#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "tee/device/database.h"
#include "tee/device/object_name.h"
#include "tee/device/replay_table.h"
#include "tee/device/sealing.h"

namespace tee {

// Every call may be made from any thread, and throws storage_error:
// TEE_ERROR_ITEM_NOT_FOUND for a storage that the device does not have (or that is not made yet);
// TEE_ERROR_CORRUPT_OBJECT when the object did not open: it is no longer there afterwards, and a
// copy lies in the table `quarantine`; TEE_ERROR_STORAGE_NOT_AVAILABLE when the database is
// missing, locked, damaged, or refused; TEE_ERROR_STORAGE_NO_SPACE; TEE_ERROR_OUT_OF_MEMORY. A
// change that was reported as done is durable. After a power cut, or when a change was reported as
// failed, the object is the old or the new one.
class object_store {
 public:
  // create: makes the database of an empty store in `folder`.
  static void create(const std::string& folder);

  // The store in `folder`, of a device with that key. Throws device_error: DAMAGED when the replay
  // table is not authentic. A missing database only shows in the calls.
  object_store(const std::string& folder, const device_key& key, bool has_rpmb);

  // make_rpmb: makes the replay-protected storage if the device has one and it is not made yet.
  void make_rpmb();

  // load: the content of an object; nothing when there is none.
  std::optional<secret_bytes> load(const object_name& name);

  // save: creates or replaces an object.
  void save(const object_name& name, std::span<const uint8_t> content);

  // remove: the object is gone afterwards, whether or not it was there.
  void remove(const object_name& name);

 private:
  struct row {
    int64_t generation;
    std::vector<uint8_t> sealed;
  };

  template <typename F>
  auto guarded(F action);
  void connect();
  replay_table* table_of(const object_name& name);
  void settle_pending();
  std::optional<row> find_row(const object_name& name);
  template <typename F>
  void change(const object_name& name, bool present, F write);
  [[noreturn]] void quarantine(const object_name& name, const std::string& reason);
  void delete_row(const object_name& name);

  std::mutex mutex_;
  std::string path_;
  device_key content_key_;
  bool has_rpmb_;
  replay_table replay_;
  std::optional<database> db_;
};

}  // namespace tee
