// Any tree of JSON values, built from the input. What the writer makes of it reads back as the same
// tree in the same order, through another implementation; a text with a string that is not UTF-8,
// or that holds a control character, does not read at all. The heap is empty afterwards.
#include "ta/soter/json.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <nlohmann/json.hpp>
#include <string>

#include "platform.h"
#include "ta/soter/utf8.h"

using namespace keymaster;
using nlohmann::ordered_json;

namespace {

void require(bool holds) {
  if (!holds) std::abort();
}

constexpr int DEEPEST = 12;
constexpr double BEHIND_LARGEST = 9223372036854775808.0;  // from 2^63 on digits may be missing

// The input: a kind byte for each value, then what the kind needs. Ends in nulls.
struct input_reader {
  byte_view rest;

  uint8_t byte() {
    if (rest.empty()) return 0;
    const uint8_t value = rest.front();
    rest = rest.subspan(1);
    return value;
  }
  std::string text() {
    const byte_view taken = rest.first(std::min<size_t>(byte(), rest.size()));
    rest = rest.subspan(taken.size());
    std::string result(taken.begin(), taken.end());
    return result;
  }
  double number() {
    uint8_t raw[sizeof(double)];
    std::ranges::generate(raw, [&] { return byte(); });
    double value = 0;
    std::memcpy(&value, raw, sizeof(raw));
    return std::abs(value) < BEHIND_LARGEST ? value : raw[0];
  }
};

byte_view bytes_of(const std::string& text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// The part of a text that counts.
std::string counted(const std::string& text) {
  return text.substr(0, text.find('\0'));
}

void build(input_reader* in, int depth, json_value* value, ordered_json* model);

void build_array(input_reader* in, int depth, json_value* value, ordered_json* model) {
  require(value->make_array());
  *model = ordered_json::array();
  for (int count = in->byte() % 8; count > 0; count--) {
    json_value element;
    ordered_json expected;
    build(in, depth + 1, &element, &expected);
    require(json_append(value->array(), std::move(element)) == 0);
    model->push_back(expected);
  }
}

void build_object(input_reader* in, int depth, json_value* value, ordered_json* model) {
  require(value->make_object());
  *model = ordered_json::object();
  for (int count = in->byte() % 8; count > 0; count--) {
    const std::string name = in->text();
    json_value member;
    ordered_json expected;
    build(in, depth + 1, &member, &expected);
    require(json_set(value->object(), name, std::move(member)) == 0);
    (*model)[counted(name)] = expected;
  }
}

void build(input_reader* in, int depth, json_value* value, ordered_json* model) {
  const uint8_t kind = in->byte();
  if (kind % 6 == 1) {
    *value = json_value((kind & 0x80) != 0);
    *model = (kind & 0x80) != 0;
  } else if (kind % 6 == 2) {
    const double number = in->number();
    *value = json_value(number);
    *model = number;
  } else if (kind % 6 == 3) {
    const std::string text = in->text();
    require(value->make_string(bytes_of(text)));
    *model = counted(text);
  } else if (kind % 6 == 4 && depth < DEEPEST) {
    build_array(in, depth, value, model);
  } else if (kind % 6 == 5 && depth < DEEPEST) {
    build_object(in, depth, value, model);
  }
}

// Whether a string may stand in a JSON text.
bool is_readable(const std::string& text) {
  const bool control = std::ranges::any_of(text, [](char c) {
    return static_cast<unsigned char>(c) < 0x20 && !strchr("\b\f\n\r\t", c);
  });
  return !control && is_valid_utf8(bytes_of(text));
}

bool is_readable(const ordered_json& value) {
  if (value.is_string()) return is_readable(value.get_ref<const std::string&>());
  const auto items = value.items();
  return !value.is_structured() || std::all_of(items.begin(), items.end(), [](const auto& item) {
    return is_readable(item.key()) && is_readable(item.value());
  });
}

// Equal but for what six decimals cannot tell.
bool same(const ordered_json& a, const ordered_json& b) {
  if (a.is_number() && b.is_number()) return std::abs(a.get<double>() - b.get<double>()) <= 1e-6;
  if (a.type() != b.type() || a.size() != b.size()) return false;
  if (!a.is_structured()) return a == b;
  const auto mine = a.items();
  const auto theirs = b.items();
  return std::equal(mine.begin(), mine.end(), theirs.begin(), [](const auto& x, const auto& y) {
    return x.key() == y.key() && same(x.value(), y.value());
  });
}

void check(const json_value& value, const ordered_json& model) {
  const bool readable = is_readable(model);
  heap_buffer text;
  require(json_serialize(value, &text));
  require(text.size() == json_text_size(value) && text.view().back() == 0);
  const byte_view body = text.view().first(text.size() - 1);
  const ordered_json read = ordered_json::parse(body.begin(), body.end(), nullptr, false);
  require(read.is_discarded() != readable);
  require(!readable || same(read, model));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  platform::reset();
  {
    input_reader in{{data, size}};
    json_value value;
    ordered_json model;
    build(&in, 0, &value, &model);
    check(value, model);
  }
  require(platform::live_blocks == 0 && platform::unwiped_blocks == 0);
  return 0;
}
