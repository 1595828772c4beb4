// A list of byte strings under 16-bit keys.
#include "ta/soter/key_list.h"

#include "ta/base/trace.h"

namespace keymaster {

key_list::~key_list() {
  while (head_ != nullptr) {
    item* first = head_;
    head_ = first->next;
    heap_delete(first);
  }
}

bool key_list::add(uint16_t key, heap_buffer&& value) {
  if (find(key) != nullptr) return false;
  auto* added = heap_new<item>();
  if (added == nullptr) {
    trace(TEE_TRACE_ERROR, "Out of memory, need %dB", static_cast<int>(sizeof(item)));
    return false;
  }
  added->key = key;
  added->value = std::move(value);
  added->next = head_;
  if (head_ != nullptr) head_->previous = added;
  head_ = added;
  return true;
}

const heap_buffer* key_list::get(uint16_t key) const {
  const item* found = find(key);
  return found == nullptr ? nullptr : &found->value;
}

bool key_list::replace(uint16_t key, heap_buffer&& value) {
  item* found = find(key);
  if (found == nullptr) return false;
  found->value = std::move(value);
  return true;
}

bool key_list::remove(uint16_t key) {
  item* found = find(key);
  if (found == nullptr) return false;
  if (found->next != nullptr) found->next->previous = found->previous;
  (found->previous != nullptr ? found->previous->next : head_) = found->next;
  heap_delete(found);
  return true;
}

key_list::item* key_list::find(uint16_t key) const {
  item* at = head_;
  while (at != nullptr && at->key != key)
    at = at->next;
  return at;
}

}  // namespace keymaster
