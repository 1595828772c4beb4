// Building, reading and marshalling of parameter sets.
#include "keymaster/client/param_set.h"

#include <algorithm>
#include <iterator>
#include <limits>

namespace keymaster::client {

namespace {

constexpr size_t ENTRY_SIZE = 24;
constexpr uint64_t MAX_32 = std::numeric_limits<uint32_t>::max();

// The largest number that a tag's class holds.
uint64_t largest_number(keymaster_tag_t tag) {
  switch (tag_class(tag)) {
    case KM_ENUM:
    case KM_ENUM_REP:
    case KM_UINT:
    case KM_UINT_REP:
      return MAX_32;
    case KM_BOOL:
      return std::numeric_limits<uint8_t>::max();
    default:
      return std::numeric_limits<uint64_t>::max();
  }
}

uint32_t checked_u32(size_t value) {
  if (value > MAX_32) throw std::length_error("a parameter set is too long to marshal");
  return static_cast<uint32_t>(value);
}

}  // namespace

param_set& param_set::add(keymaster_tag_t tag, uint64_t number) {
  if (has_blob(tag)) throw std::invalid_argument("the tag holds bytes, not a number");
  if (number > largest_number(tag)) throw std::invalid_argument("the number is too large");
  params_.push_back({tag, number, {}});
  return *this;
}

param_set& param_set::add_bytes(keymaster_tag_t tag, byte_view data) {
  if (!has_blob(tag)) throw std::invalid_argument("the tag holds a number, not bytes");
  params_.push_back({tag, 0, copy_of(data)});
  return *this;
}

param_set& param_set::append(param_set other) {
  std::ranges::move(other.params_, std::back_inserter(params_));
  return *this;
}

size_t param_set::count(keymaster_tag_t tag) const {
  auto matches = std::ranges::count(params_, tag, &param::tag);
  return static_cast<size_t>(matches);
}

const param* param_set::find(keymaster_tag_t tag) const {
  auto found = std::ranges::find(params_, tag, &param::tag);
  return found == params_.end() ? nullptr : &*found;
}

std::optional<uint64_t> param_set::number(keymaster_tag_t tag) const {
  const param* found = find(tag);
  if (!found) return std::nullopt;
  return found->number;
}

std::vector<uint64_t> param_set::numbers(keymaster_tag_t tag) const {
  std::vector<uint64_t> values;
  for (const param& entry : params_) {
    if (entry.tag == tag) values.push_back(entry.number);
  }
  return values;
}

bytes param_set::marshal() const {
  field_writer out;
  out.u32(checked_u32(params_.size()));
  for (const param& entry : params_) {
    uint32_t data_length = checked_u32(entry.data.size());
    out.u32(entry.tag).u32(0).u64(entry.number).u32(data_length).u32(0).raw(entry.data);
  }
  return out.take();
}

param_set param_set::parse(byte_view marshalled) {
  field_reader in(marshalled);
  uint32_t count = in.u32();
  if (count > in.left() / ENTRY_SIZE) {
    throw format_error("announces more parameters than it can hold");
  }
  param_set set;
  set.params_.reserve(count);
  for (uint32_t i = 0; i < count; ++i) {
    param entry;
    entry.tag = in.u32();
    in.u32();
    uint64_t value = in.u64();
    uint32_t data_length = in.u32();
    in.u32();
    if (has_blob(entry.tag)) {
      entry.data = copy_of(in.raw(data_length));
    } else {
      // Wider than the class, the field carries what the writer's record held there.
      entry.number = value & largest_number(entry.tag);
    }
    set.params_.push_back(std::move(entry));
  }
  in.finish();
  return set;
}

}  // namespace keymaster::client
