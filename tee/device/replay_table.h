// What the device remembers of its replay-protected storage outside the database: for every object
// the generation in which it was last written. The file stands for the write counter of the storage
// hardware; a database row of another generation is an old copy.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "tee/device/object_name.h"
#include "tee/device/sealing.h"

namespace tee {

// A change of an object goes in three steps, so that a power cut between any two leaves the
// database row and the table agreeing on the old object or on the new one:
//   prepare   the table durably holds the old generation and, as pending, the new one
//   (commit)  the database row changes
//   settle    the table drops the generation that the row does not have
// While a change is pending, either generation is current: the change was never reported as done,
// so neither state is a replay. Callers settle a pending change before they look at anything else.
//
// File, little-endian: "KMRT", u32 version (1), u64 counter, u32 count, count entries, u32 number
// of pending entries (0 or 1), that entry, HMAC-SHA256 of all before. Entry: TA (16, network
// order), u8 id length, id, u64 generation (0 as pending: the object goes away).
class replay_table {
 public:
  // Of `path`, with MACs under `key`. Throws device_error: DAMAGED when the file is not authentic.
  replay_table(std::string path, device_key key);

  // exists: the file system was made. make does so (an empty table); throws file_error.
  bool exists() const { return made_; }
  void make();

  // generation_of: the object's current generation; 0 when it is not in the storage.
  uint64_t generation_of(const object_name& name) const;

  // prepare: returns the generation that the row is to carry, 0 when the object is to go away.
  // Throws file_error, and then nothing is pending.
  uint64_t prepare(const object_name& name, bool present);

  // pending: the object whose change is not settled. settle ends it, given the generation in the
  // database (0: no row); on file_error the change stays pending.
  const object_name* pending() const;
  void settle(uint64_t row_generation);

 private:
  struct content {
    uint64_t counter = 0;
    std::map<object_name, uint64_t> generations;
    std::optional<std::pair<object_name, uint64_t>> pending;
  };

  void read();
  void store(content next);

  std::string path_;
  device_key key_;
  bool made_ = false;
  content content_;
};

}  // namespace tee
