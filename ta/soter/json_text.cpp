// The text of JSON values. One walk serves both to measure and to write.
#include <algorithm>
#include <cstdio>
#include <cstring>

#include "ta/soter/json.h"

namespace keymaster {
namespace {

constexpr size_t NUMBER_SIZE = 30;  // characters with the terminating zero

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
  void put(std::string_view text) {
    put(byte_view(reinterpret_cast<const uint8_t*>(text.data()), text.size()));
  }
  uint64_t length() const { return length_; }

 private:
  byte_span room_;
  uint64_t length_ = 0;
};

// What stands for a byte in a string; empty when it stands for itself.
std::string_view escape(uint8_t byte) {
  switch (byte) {
    case '"':
      return "\\\"";
    case '\\':
      return "\\\\";
    case '/':
      return "\\/";
    case '\b':
      return "\\b";
    case '\f':
      return "\\f";
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      return {};
  }
}

void put_string(json_writer* out, byte_view text) {
  const auto is_escaped = [](uint8_t byte) { return !escape(byte).empty(); };
  out->put("\"");
  for (;;) {
    const auto plain = static_cast<size_t>(std::ranges::find_if(text, is_escaped) - text.begin());
    out->put(text.first(plain));
    if (plain == text.size()) break;
    out->put(escape(text[plain]));
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
  out->put(std::string_view(text, strlen(text)));
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
