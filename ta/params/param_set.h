// Key parameter sets: counted arrays of tagged values in the Keymaster tag scheme. Key
// descriptions, key characteristics and the parameters of operations are all such sets.
#pragma once

#include <cstddef>
#include <cstdint>
#include <utility>

#include "ta/base/bytes.h"
#include "ta/base/heap.h"
#include "ta/base/outcome.h"
#include "ta/params/tags.h"

namespace keymaster {

// keymaster_key_param_t: one parameter, laid out as its marshalled entry (24 bytes, little-endian).
// The member that is in use follows from the tag's class. A blob parameter owns `data` through its
// set.
struct keymaster_key_param_t {
  keymaster_tag_t tag;
  uint32_t tag_gap;
  union {
    uint32_t enumerated;
    uint32_t integer;
    uint64_t long_integer;
    uint64_t date_time;  // ms since the epoch
    uint8_t boolean;
    uint8_t* data;
  };
  uint32_t data_length;  // bytes; blob parameters only
  uint32_t length_gap;

  byte_view blob() const { return {data, data_length}; }
};
static_assert(sizeof(keymaster_key_param_t) == 24);
static_assert(offsetof(keymaster_key_param_t, long_integer) == 8);
static_assert(offsetof(keymaster_key_param_t, data_length) == 16);

// keymaster_key_param_set_t: owns its array and the blobs of its entries. Moves, never copies. An
// empty set has a null array and length 0.
struct keymaster_key_param_set_t {
  keymaster_key_param_t* params = nullptr;
  uint32_t length = 0;

  keymaster_key_param_set_t() = default;
  keymaster_key_param_set_t(keymaster_key_param_set_t&& other) noexcept
      : params(std::exchange(other.params, nullptr)), length(std::exchange(other.length, 0)) {}
  keymaster_key_param_set_t& operator=(keymaster_key_param_set_t&& other) noexcept;
  ~keymaster_key_param_set_t();

  const keymaster_key_param_t* begin() const { return params; }
  const keymaster_key_param_t* end() const { return params + (params == nullptr ? 0 : length); }
};

// How many entries carry `tag`; whether any does; whether at most one does.
uint32_t count_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag);
bool contains_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag);
bool tag_at_most_once(const keymaster_key_param_set_t& set, keymaster_tag_t tag);

// get_unique: the entry with `tag` when there is exactly one; null when the tag is absent or
// repeated.
const keymaster_key_param_t* get_unique(const keymaster_key_param_set_t& set, keymaster_tag_t tag);
keymaster_key_param_t* get_unique(keymaster_key_param_set_t& set, keymaster_tag_t tag);

// unique_blob: the bytes of the unique entry with `tag`; an empty view when there is none.
byte_view unique_blob(const keymaster_key_param_set_t& set, keymaster_tag_t tag);

// add_param: appends one record, growing the array by one. The set takes over a blob entry's data.
// False when out of memory: the set is as it was and the caller keeps the data.
[[nodiscard]] bool add_param(keymaster_key_param_set_t* set, const keymaster_key_param_t& entry);
// The same for a 32-bit value, a 64-bit value, and a copy of some bytes; unused bytes are zero.
[[nodiscard]] bool add_integer(keymaster_key_param_set_t* set, keymaster_tag_t tag, uint32_t value);
[[nodiscard]] bool add_long(keymaster_key_param_set_t* set, keymaster_tag_t tag, uint64_t value);
[[nodiscard]] bool add_blob(keymaster_key_param_set_t* set, keymaster_tag_t tag, byte_view bytes);

// free_param_entries: wipes and frees the blobs of `count` entries and nulls their pointers.
void free_param_entries(keymaster_key_param_t* params, uint32_t count);

// free_param_set: frees the blobs and the array and nulls the array's pointer; a null set is
// ignored. `length` keeps its value: code that uses the set again also sets it to 0.
void free_param_set(keymaster_key_param_set_t* set);

// settle_failure: the rule at the end of every failed path: a failure whose both results are 0
// leaves as KM_ERROR_UNKNOWN_ERROR, so that no failure is ever reported as success.
outcome settle_failure(outcome how);

}  // namespace keymaster
