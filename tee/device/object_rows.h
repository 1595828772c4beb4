// The sealed rows of the persistent objects, in the SQLite database storage.db.
//
// A row carries storage id, TA, object id and generation in clear; its content is sealed under a
// key of the device with these bound in, so an edited or swapped row does not open. The database
// carries a tag of the device, so that another device's is told from its own.
#pragma once

#include <optional>
#include <span>
#include <vector>

#include "tee/device/database.h"
#include "tee/device/folder.h"
#include "tee/device/object_name.h"
#include "tee/device/sealing.h"

namespace tee {

// Calls throw storage_error as database does.
class object_rows {
 public:
  struct row {
    uint64_t generation;  // never 0 in a row that was written
    std::vector<uint8_t> sealed;
  };

  // create: makes the database of an empty store in a new folder.
  static void create(const device_folder& folder, const device_key& key);

  // Those of the device with that key. The folder must outlive them.
  object_rows(const device_folder& folder, const device_key& key);

  // connect: opens the database; anew when its file was exchanged, since the old one would be
  // written into nothing. Throws device_error: DAMAGED when it is missing, is no object store or
  // belongs to another device; else storage_error.
  void connect();

  std::optional<row> find(const object_name& name);
  std::vector<object_name> names();

  // open: the content of a row of that name; nothing when it is not authentic.
  std::optional<secret_bytes> open(const object_name& name, const row& found) const;

  // put, erase: one durable transaction each.
  void put(const object_name& name, uint64_t generation, std::span<const uint8_t> content);
  void erase(const object_name& name);

 private:
  friend class earlier_form;
  void write(const object_name& name, uint64_t generation, std::span<const uint8_t> content);
  void mark();
  void require_own(database* db) const;

  const device_folder& folder_;
  device_key content_key_;
  device_key tag_;
  std::optional<database> db_;
};

}  // namespace tee
