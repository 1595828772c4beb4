// JSON values: owned trees that are built member by member.
#include "ta/soter/json.h"

#include <algorithm>

#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

byte_view up_to_zero(byte_view text) {
  return text.first(static_cast<size_t>(std::ranges::find(text, 0) - text.begin()));
}

json_item* find_member(const json_list& object, byte_view name) {
  for (json_item* item = object.first; item != nullptr; item = item->next) {
    if (std::ranges::equal(item->name.view(), name)) return item;
  }
  return nullptr;
}

// Adds an item that the list takes over.
void link(json_list* list, json_item* item) {
  (list->last == nullptr ? list->first : list->last->next) = item;
  list->last = item;
}

}  // namespace

json_list::~json_list() {
  while (first != nullptr) {
    json_item* next = first->next;
    heap_delete(first);
    first = next;
  }
}

json_value::~json_value() {
  heap_delete(list_);
}

bool json_value::make_string(byte_view text) {
  json_value made;
  made.type_ = json_type::STRING;
  if (!made.string_.copy_of(up_to_zero(text))) return false;
  swap(made);
  return true;
}

bool json_value::make_list(json_type type) {
  json_value made;
  made.type_ = type;
  made.list_ = heap_new<json_list>();
  if (made.list_ == nullptr) return false;
  swap(made);
  return true;
}

void json_value::swap(json_value& other) noexcept {
  std::swap(type_, other.type_);
  std::swap(boolean_, other.boolean_);
  std::swap(number_, other.number_);
  std::swap(string_, other.string_);
  std::swap(list_, other.list_);
}

int json_append(json_list* array, json_value value) {
  if (array == nullptr) return -1;
  auto* item = heap_new<json_item>();
  if (item == nullptr) return -1;
  item->value = std::move(value);
  link(array, item);
  return 0;
}

int json_set(json_list* object, std::string_view name, json_value value) {
  if (object == nullptr) return -1;
  const byte_view text = up_to_zero(text_bytes(name));
  if (json_item* item = find_member(*object, text)) {
    item->value = std::move(value);
    return 0;
  }
  heap_buffer copy;
  if (!copy.copy_of(text) || json_append(object, std::move(value)) != 0) return -1;
  object->last->name = std::move(copy);
  return 0;
}

int json_set_string(json_list* object, std::string_view name, byte_view text) {
  json_value value;
  return value.make_string(text) ? json_set(object, name, std::move(value)) : -1;
}

int json_set_number(json_list* object, std::string_view name, double number) {
  return json_set(object, name, json_value(number));
}

}  // namespace keymaster
