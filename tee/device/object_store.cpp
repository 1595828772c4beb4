// The persistent objects of a device: sealed rows, held against the replay table.
#include "tee/device/object_store.h"

#include "tee_extensions.h"

#include <cerrno>
#include <new>
#include <set>

namespace tee {

namespace {

TEE_Result result_of(const file_error& error) {
  bool full = error.error_number() == ENOSPC || error.error_number() == EDQUOT;
  return full ? TEE_ERROR_STORAGE_NO_SPACE : TEE_ERROR_STORAGE_NOT_AVAILABLE;
}

}  // namespace

void object_store::create(const device_folder& folder, const device_key& key) {
  object_rows::create(folder, key);
  replay_table::create(folder, key);
}

object_store::object_store(const device_folder& folder, const device_key& key, bool has_rpmb)
    : has_rpmb_(has_rpmb), rows_(folder, key), replay_(folder, key) {
  rows_.connect();
}

// Runs a call's work with the store to itself, connected, and lets only storage_error out.
template <typename F>
auto object_store::guarded(F action) {
  if (!opened_in_.at_home()) {
    throw storage_error(TEE_ERROR_STORAGE_NOT_AVAILABLE,
                        "object store: a forked process has no part in the device");
  }
  std::lock_guard lock(mutex_);
  try {
    rows_.connect();
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

void object_store::require_storage(const object_name& name) const {
  if (name.storage == TEE_STORAGE_PRIVATE) return;
  if (name.storage == TEE_STORAGE_RPMB && has_rpmb_) return;
  throw storage_error(TEE_ERROR_ITEM_NOT_FOUND, "object store: no such storage");
}

// What is wrong with an object whose row is this; empty, and the content is there, when nothing is.
std::string object_store::judge(const object_name& name, const std::optional<object_rows::row>& row,
                                std::optional<secret_bytes>* content) const {
  const replay_entry entry = replay_.entry_of(name);
  if (!row) return entry.fits(0) ? "" : "its row is missing";
  if (row->generation == 0 || !entry.fits(row->generation)) {
    return entry.current == 0 && !entry.next ? "its row came back after it was removed"
                                             : "its row is of another generation";
  }
  *content = rows_.open(name, *row);
  return *content ? "" : "its row is not authentic";
}

// The object as it is, with nothing left to settle.
std::optional<secret_bytes> object_store::current(const object_name& name) {
  require_storage(name);
  const auto row = rows_.find(name);
  std::optional<secret_bytes> content;
  if (std::string fault = judge(name, row, &content); !fault.empty()) {
    throw storage_error(TEE_ERROR_CORRUPT_OBJECT, "object store: corrupt object, " + fault);
  }
  if (replay_.entry_of(name).next) replay_.settle(name, row ? row->generation : 0);
  return content;
}

template <typename F>
void object_store::change(const object_name& name, bool present, F write) {
  const uint64_t generation = replay_.prepare(name, present);
  write(generation);
  replay_.settle(name, generation);
}

std::optional<secret_bytes> object_store::load(const object_name& name) {
  return guarded([&] { return current(name); });
}

void object_store::save(const object_name& name, std::span<const uint8_t> content) {
  guarded([&] {
    current(name);
    change(name, true, [&](uint64_t generation) { rows_.put(name, generation, content); });
  });
}

void object_store::remove(const object_name& name) {
  guarded([&] {
    if (!current(name)) return;
    change(name, false, [&](uint64_t) { rows_.erase(name); });
  });
}

std::vector<damaged_object> object_store::check() {
  return guarded([&] {
    std::set<object_name> names;
    for (object_name& name : rows_.names())
      names.insert(std::move(name));
    for (const auto& [name, entry] : replay_.all())
      names.insert(name);
    std::vector<damaged_object> damaged;
    for (const object_name& name : names) {
      std::optional<secret_bytes> content;
      std::string fault = judge(name, rows_.find(name), &content);
      if (!fault.empty()) damaged.push_back({name, std::move(fault)});
    }
    return damaged;
  });
}

void object_store::forget(const object_name& name) {
  guarded([&] { change(name, false, [&](uint64_t) { rows_.erase(name); }); });
}

}  // namespace tee
