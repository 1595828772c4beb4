// Tables and JSON of parameter sets.
#include "listing.h"

#include <algorithm>
#include <vector>

#include "keymaster/client/names.h"

namespace kmtool {

using namespace keymaster;
using client::param;
using client::param_set;

namespace {

// The tags of a set, each once, in order of first occurrence.
std::vector<keymaster_tag_t> tags_of(const param_set& params) {
  std::vector<keymaster_tag_t> tags;
  for (const param& entry : params) {
    if (std::ranges::find(tags, entry.tag) == tags.end()) tags.push_back(entry.tag);
  }
  return tags;
}

bool may_repeat(keymaster_tag_t tag) {
  uint32_t kind = tag_class(tag);
  return kind == KM_ENUM_REP || kind == KM_UINT_REP || kind == KM_ULONG_REP;
}

std::string title_of(keymaster_tag_t tag) {
  std::string title = client::tag_name(tag);
  std::ranges::replace(title, '_', ' ');
  return title;
}

std::string unit_of(keymaster_tag_t tag) {
  return tag == KM_TAG_KEY_SIZE || tag == KM_TAG_MIN_MAC_LENGTH || tag == KM_TAG_MAC_LENGTH
             ? " bits"
             : "";
}

json value_to_json(const param& entry) {
  switch (tag_class(entry.tag)) {
    case KM_UINT:
    case KM_UINT_REP:
    case KM_ULONG:
    case KM_ULONG_REP:
      return entry.number;
    case KM_BOOL:
      return entry.number != 0;
    default:
      return client::describe_value(entry);
  }
}

}  // namespace

table& table::row(const std::string& name, const std::string& value) {
  rows_.emplace_back(name, value);
  return *this;
}

std::string table::text(const std::string& indent) const {
  size_t width = 0;
  for (const auto& [name, value] : rows_)
    width = std::max(width, name.size());
  std::string lines;
  for (const auto& [name, value] : rows_) {
    lines += indent + name + std::string(width - name.size() + 2, ' ') + value + "\n";
  }
  return lines;
}

table list_params(const param_set& params) {
  table lines;
  for (keymaster_tag_t tag : tags_of(params)) {
    std::string values;
    for (const param& entry : params) {
      if (entry.tag != tag) continue;
      values += (values.empty() ? "" : ", ") + client::describe_value(entry) + unit_of(tag);
    }
    lines.row(title_of(tag), values);
  }
  return lines;
}

json params_to_json(const param_set& params) {
  json object = json::object();
  for (const param& entry : params) {
    json& member = object[client::tag_name(entry.tag)];
    if (may_repeat(entry.tag) || params.count(entry.tag) > 1) {
      member.push_back(value_to_json(entry));
    } else {
      member = value_to_json(entry);
    }
  }
  return object;
}

}  // namespace kmtool
