// The text of JSON values. One walk serves both to measure and to write.
#include <algorithm>
#include <cstdio>

#include "ta/soter/json.h"
#include "ta/soter/utf8.h"

namespace keymaster {
namespace {

constexpr size_t NUMBER_SIZE = 30;  // characters with the terminating zero

// What is escaped in strings, and the letter that follows the backslash in its place.
constexpr std::string_view ESCAPED = "\"\\/\b\f\n\r\t";
constexpr std::string_view LETTERS = "\"\\/bfnrt";

// json_writer: counts the bytes of a text and, given room, writes them.
class json_writer {
 public:
  json_writer() = default;
  explicit json_writer(byte_span room) : room_(room) {}

  void put(byte_view bytes) {
    if (bytes.size() <= room_.size()) {
      copy_bytes(room_, bytes);
      room_ = room_.subspan(bytes.size());
    }
    length_ += bytes.size();
  }
  void put(std::string_view text) { put(text_bytes(text)); }
  uint64_t length() const { return length_; }

 private:
  byte_span room_;
  uint64_t length_ = 0;
};

void put_string(json_writer* out, byte_view text) {
  out->put("\"");
  for (;;) {
    const auto escaped = std::ranges::find_first_of(text, ESCAPED);
    const auto plain = static_cast<size_t>(escaped - text.begin());
    out->put(text.first(plain));
    if (plain == text.size()) break;
    const auto row = static_cast<size_t>(std::ranges::find(ESCAPED, *escaped) - ESCAPED.begin());
    out->put("\\");
    out->put({&LETTERS[row], 1});
    text = text.subspan(plain + 1);
  }
  out->put("\"");
}

// Whether a number is one of int64_t. Comes before every cast: outside the range that is undefined.
bool is_integer(double number) {
  constexpr double BEHIND_LARGEST = 9223372036854775808.0;  // 2^63
  return number >= -BEHIND_LARGEST && number < BEHIND_LARGEST &&
         static_cast<double>(static_cast<int64_t>(number)) == number;
}

void put_number(json_writer* out, double number) {
  char text[NUMBER_SIZE] = {};
  if (is_integer(number)) {
    snprintf(text, sizeof(text), "%lld", static_cast<long long>(number));
  } else {
    snprintf(text, sizeof(text), "%f", number);
  }
  out->put(text);
}

void put_value(json_writer* out, const json_value& value);

// Elements, or members with their names, between brackets.
void put_list(json_writer* out, const json_list& list, bool named) {
  out->put(named ? "{" : "[");
  for (const json_item* item = list.first; item != nullptr; item = item->next) {
    if (item != list.first) out->put(",");
    if (named) {
      put_string(out, item->name.view());
      out->put(":");
    }
    put_value(out, item->value);
  }
  out->put(named ? "}" : "]");
}

void put_value(json_writer* out, const json_value& value) {
  switch (value.type()) {
    case json_type::NOTHING:
      return out->put("null");
    case json_type::BOOLEAN:
      return out->put(value.boolean() ? "true" : "false");
    case json_type::NUMBER:
      return put_number(out, value.number());
    case json_type::STRING:
      return put_string(out, value.string());
    case json_type::ARRAY:
      return put_list(out, *value.array(), false);
    case json_type::OBJECT:
      return put_list(out, *value.object(), true);
  }
}

}  // namespace

uint64_t json_text_size(const json_value& value) {
  json_writer counter;
  put_value(&counter, value);
  return counter.length() + 1;
}

bool json_serialize(const json_value& value, heap_buffer* text) {
  text->reset();
  const uint64_t size = json_text_size(value);
  heap_buffer made;
  if (size > UINT32_MAX || !made.allocate(static_cast<size_t>(size))) return false;
  json_writer writer(made.span());  // the zero byte is there already
  put_value(&writer, value);
  *text = std::move(made);
  return true;
}

}  // namespace keymaster
