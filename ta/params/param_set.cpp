// Key parameter sets. Sets hold tens of entries, so every query is a scan and every insertion grows
// the array by one; entries keep the order in which they were added, which is also their marshalled
// order.
#include "ta/params/param_set.h"

namespace keymaster {

keymaster_key_param_set_t& keymaster_key_param_set_t::operator=(
    keymaster_key_param_set_t&& other) noexcept {
  if (this != &other) {
    free_param_set(this);
    params = std::exchange(other.params, nullptr);
    length = std::exchange(other.length, 0);
  }
  return *this;
}

keymaster_key_param_set_t::~keymaster_key_param_set_t() {
  free_param_set(this);
}

uint32_t count_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  uint32_t count = 0;
  for (const keymaster_key_param_t& param : set) {
    if (param.tag == tag) count++;
  }
  return count;
}

bool contains_tag(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  return count_tag(set, tag) != 0;
}

bool tag_at_most_once(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  return count_tag(set, tag) <= 1;
}

const keymaster_key_param_t* get_unique(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  const keymaster_key_param_t* found = nullptr;
  for (const keymaster_key_param_t& param : set) {
    if (param.tag != tag) continue;
    if (found != nullptr) return nullptr;
    found = &param;
  }
  return found;
}

keymaster_key_param_t* get_unique(keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  return const_cast<keymaster_key_param_t*>(get_unique(std::as_const(set), tag));
}

byte_view unique_blob(const keymaster_key_param_set_t& set, keymaster_tag_t tag) {
  const keymaster_key_param_t* param = get_unique(set, tag);
  return param == nullptr ? byte_view{} : param->blob();
}

bool add_param(keymaster_key_param_set_t* set, const keymaster_key_param_t& entry) {
  const size_t old_size = set->params == nullptr ? 0 : set->length * sizeof(entry);
  void* grown = heap_grow(set->params, old_size, old_size + sizeof(entry));
  if (grown == nullptr) return false;
  set->params = static_cast<keymaster_key_param_t*>(grown);
  set->params[old_size / sizeof(entry)] = entry;
  set->length = static_cast<uint32_t>(old_size / sizeof(entry)) + 1;
  return true;
}

bool add_integer(keymaster_key_param_set_t* set, keymaster_tag_t tag, uint32_t value) {
  return add_long(set, tag, value);  // little-endian: a 32-bit value lies in the first four bytes
}

bool add_long(keymaster_key_param_set_t* set, keymaster_tag_t tag, uint64_t value) {
  keymaster_key_param_t entry{};
  entry.tag = tag;
  entry.long_integer = value;
  return add_param(set, entry);
}

bool add_blob(keymaster_key_param_set_t* set, keymaster_tag_t tag, byte_view bytes) {
  heap_buffer copy;
  if (!copy.copy_of(bytes)) return false;
  keymaster_key_param_t entry{};
  entry.tag = tag;
  entry.data = copy.data();
  entry.data_length = static_cast<uint32_t>(bytes.size());
  if (!add_param(set, entry)) return false;
  static_cast<void>(copy.release());  // the set owns it now
  return true;
}

void free_param_entries(keymaster_key_param_t* params, uint32_t count) {
  for (uint32_t i = 0; i < count; i++) {
    keymaster_key_param_t& param = params[i];
    if (!has_blob(param.tag) || param.data == nullptr) continue;
    heap_give_back(param.data, param.data_length);
    param.data = nullptr;
  }
}

void free_param_set(keymaster_key_param_set_t* set) {
  if (set == nullptr || set->params == nullptr) return;
  free_param_entries(set->params, set->length);
  heap_give_back(set->params, set->length * sizeof(keymaster_key_param_t));
  set->params = nullptr;
}

outcome settle_failure(outcome how) {
  return failed(how) ? how : KM_ERROR_UNKNOWN_ERROR;
}

}  // namespace keymaster
