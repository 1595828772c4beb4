// A list of byte strings under 16-bit keys.
#pragma once

#include <cstdint>

#include "ta/base/heap.h"

namespace keymaster {

// key_list: items under keys that occur once each. A new item is put at the head, and a walk goes
// from there: what was added last comes first.
class key_list {
 public:
  struct item {
    uint16_t key = 0;
    heap_buffer value;
    item* next = nullptr;
    item* previous = nullptr;
  };

  key_list() = default;
  key_list(const key_list&) = delete;
  key_list& operator=(const key_list&) = delete;
  ~key_list();

  // add: takes the value over; false when the key is there already or memory runs out.
  [[nodiscard]] bool add(uint16_t key, heap_buffer&& value);

  // get: the value under `key`, or null.
  const heap_buffer* get(uint16_t key) const;

  // replace: puts another value in the place of the one under `key`; false when there is none.
  [[nodiscard]] bool replace(uint16_t key, heap_buffer&& value);

  // remove: false when nothing is under `key`.
  bool remove(uint16_t key);

  // head: where a walk begins; null when the list is empty.
  const item* head() const { return head_; }

 private:
  item* find(uint16_t key) const;

  item* head_ = nullptr;
};

}  // namespace keymaster
