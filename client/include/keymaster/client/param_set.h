// Key parameter sets as the client builds and reads them, and their marshalled form:
//   u32 count, then `count` entries; an entry is 24 bytes, little-endian:
//     0 u32 tag, 4 u32 zero, 8 value (8 bytes), 16 u32 data_length, 20 u32 zero,
//   and data_length bytes follow it when the tag's class is KM_BIGNUM or KM_BYTES.
#pragma once

#include <optional>
#include <vector>

#include "keymaster/client/bytes.h"
#include "keymaster/tags.h"

namespace keymaster::client {

// One tagged value. `data` counts for tags of the classes KM_BIGNUM and KM_BYTES, `number` for all
// others: an enumeration value, an integer, a date (milliseconds since 1970) or a boolean (1).
struct param {
  keymaster_tag_t tag = KM_TAG_INVALID;
  uint64_t number = 0;
  bytes data;

  bool operator==(const param&) const = default;
};

// An ordered list of parameters; tags may repeat.
class param_set {
 public:
  // add: appends a number. std::invalid_argument when the tag's class holds bytes, or when the
  // number does not fit it (32 bits for enumerations and integers, 8 for booleans).
  param_set& add(keymaster_tag_t tag, uint64_t number);

  // add_flag: appends a boolean that is true.
  param_set& add_flag(keymaster_tag_t tag) { return add(tag, 1); }

  // add_bytes: appends bytes. std::invalid_argument when the tag's class holds a number.
  param_set& add_bytes(keymaster_tag_t tag, byte_view data);

  // append: adds the parameters of another set behind these.
  param_set& append(param_set other);

  size_t count(keymaster_tag_t tag) const;
  bool contains(keymaster_tag_t tag) const { return find(tag) != nullptr; }

  // find: the first parameter with that tag, or null.
  const param* find(keymaster_tag_t tag) const;

  // number, numbers: the value of the first parameter with that tag; of all of them.
  std::optional<uint64_t> number(keymaster_tag_t tag) const;
  std::vector<uint64_t> numbers(keymaster_tag_t tag) const;

  size_t size() const { return params_.size(); }
  bool empty() const { return params_.empty(); }
  auto begin() const { return params_.begin(); }
  auto end() const { return params_.end(); }
  bool operator==(const param_set&) const = default;

  // marshal: the byte form. std::length_error for data or a count of 2^32 or more.
  bytes marshal() const;

  // parse: the set whose byte form is exactly `marshalled`; the value field of a data entry is not
  // looked at. Throws format_error, also when bytes are left over.
  static param_set parse(byte_view marshalled);

 private:
  std::vector<param> params_;
};

}  // namespace keymaster::client
