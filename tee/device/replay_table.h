// What the device remembers of its storage outside the database: for every object the generation in
// which it was last written. The file stands for the write counter of the storage hardware; a
// database row of another generation is an old copy.
#pragma once

#include <cstdint>
#include <map>
#include <optional>

#include "tee/device/folder.h"
#include "tee/device/object_name.h"
#include "tee/device/sealing.h"

namespace tee {

// Generations of an object; 0 stands for an object that is not there.
struct replay_entry {
  uint64_t current = 0;
  std::optional<uint64_t> next;  // of a change that is not settled

  // fits: whether a row of that generation (0: no row) is no replay.
  bool fits(uint64_t row) const { return row == current || row == next; }
};

// A change of an object goes in three steps, so that a power cut between any two leaves the
// database row and the table agreeing on the old object or on the new one:
//   prepare   the table durably holds the old generation and the next one
//   (commit)  the database row changes
//   settle    the table drops the generation that the row does not have
// Until a change is settled either generation is current: it was never reported as done, so neither
// state is a replay. Whoever looks at the object settles it first.
//
// File "replay", little-endian: "KMRT", u32 form (2), u64 counter, u32 count, count entries,
// HMAC-SHA256 of all before. Entry: u32 storage, TA (16, network order), u8 id length, id, u64
// current, u8 whether there is a next, u64 next.
class replay_table {
 public:
  using entries = std::map<object_name, replay_entry>;

  // create: makes an empty table in a new folder.
  static void create(const device_folder& folder, const device_key& key);

  // Of a device with that key. The folder must outlive it. Throws device_error: DAMAGED when the
  // table is missing or not authentic.
  replay_table(const device_folder& folder, const device_key& key);

  // entry_of: what is known of the object.
  replay_entry entry_of(const object_name& name) const;
  const entries& all() const { return content_.objects; }

  // prepare: returns the generation that the row is to carry, 0 when the object is to go away.
  // Throws file_error, and then nothing has changed.
  uint64_t prepare(const object_name& name, bool present);

  // settle: ends a change, given the generation in the database, which fits. On file_error the
  // change stays as it is.
  void settle(const object_name& name, uint64_t row_generation);

 private:
  friend class earlier_form;
  struct content {
    uint64_t counter = 0;
    entries objects;
  };

  static device_key mac_key(const device_key& key) { return derive_key(key, "replay table"); }
  static void store(const device_folder& folder, const device_key& mac_key, const content& what);
  void replace(content next);
  void parse(std::span<const uint8_t> body);

  const device_folder& folder_;
  device_key mac_key_;
  content content_;
};

}  // namespace tee
