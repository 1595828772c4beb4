// JSON values and their text (RFC 8259). The exact bytes of the text are signed, so its form is
// fixed: no white space, members in the order in which they were set, "/" always escaped.
#pragma once

#include <cstdint>
#include <string_view>

#include "ta/base/heap.h"

namespace keymaster {

enum class json_type : uint8_t { NOTHING, BOOLEAN, NUMBER, STRING, ARRAY, OBJECT };

class json_value;
struct json_item;

// json_list: the elements of an array, or the members of an object in the order of their names'
// first setting. Owns its items.
struct json_list {
  json_item* first = nullptr;
  json_item* last = nullptr;

  json_list() = default;
  json_list(const json_list&) = delete;
  json_list& operator=(const json_list&) = delete;
  ~json_list();
};

// json_value: one value and everything below it; null ("NOTHING") until it is made something else.
// Moves, never copies.
class json_value {
 public:
  json_value() = default;
  explicit json_value(bool value) : type_(json_type::BOOLEAN), boolean_(value) {}
  explicit json_value(double value) : type_(json_type::NUMBER), number_(value) {}
  json_value(json_value&& other) noexcept { swap(other); }
  json_value& operator=(json_value&& other) noexcept {
    json_value taken(std::move(other));
    swap(taken);
    return *this;
  }
  ~json_value();

  // Turn the value into a string with a copy of `text` up to its first zero byte, an empty array,
  // an empty object. False when out of memory: the value is as it was.
  [[nodiscard]] bool make_string(byte_view text);
  [[nodiscard]] bool make_array() { return make_list(json_type::ARRAY); }
  [[nodiscard]] bool make_object() { return make_list(json_type::OBJECT); }

  json_type type() const { return type_; }
  bool boolean() const { return boolean_; }
  double number() const { return number_; }
  byte_view string() const { return string_.view(); }
  // The list of an array, or of an object; null when the value is another.
  json_list* array() const { return type_ == json_type::ARRAY ? list_ : nullptr; }
  json_list* object() const { return type_ == json_type::OBJECT ? list_ : nullptr; }

 private:
  bool make_list(json_type type);
  void swap(json_value& other) noexcept;

  json_type type_ = json_type::NOTHING;
  bool boolean_ = false;
  double number_ = 0;
  heap_buffer string_;
  json_list* list_ = nullptr;
};

// json_item: an element of an array, or a member of an object.
struct json_item {
  heap_buffer name;  // of a member
  json_value value;
  json_item* next = nullptr;
};

// json_append: adds `value` at the end of an array. json_set: sets the member `name` of an object:
// a new one comes last, the value of one that is there is replaced where it stands. json_set_string
// and json_set_number: the same with a copy of `text`, up to its first zero byte, and a number. 0,
// or -1 when the list is null or memory has run out: the list is then as it was.
[[nodiscard]] int json_append(json_list* array, json_value value);
[[nodiscard]] int json_set(json_list* object, std::string_view name, json_value value);
[[nodiscard]] int json_set_string(json_list* object, std::string_view name, byte_view text);
[[nodiscard]] int json_set_number(json_list* object, std::string_view name, double number);

// json_text_size: the size in bytes of the value's text with its terminating zero byte.
// json_serialize: puts that text and its zero byte into *text; false, with *text empty, when out of
// memory or when the text does not fit a 32-bit length. In strings `"`, `\`, `/`, backspace, form
// feed, line feed, carriage return and tab are escaped; every other byte stands as it is, control
// characters among them: intended, verifiers rely on the very bytes. A number equal to a signed
// 64-bit integer is written as that, any other with six decimals, of which the first 29 characters
// count.
[[nodiscard]] uint64_t json_text_size(const json_value& value);
[[nodiscard]] bool json_serialize(const json_value& value, heap_buffer* text);

}  // namespace keymaster
