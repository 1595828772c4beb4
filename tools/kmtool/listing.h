// Parameter sets as people and programs read them.
#pragma once

#include <string>

#include "keymaster/client/param_set.h"
#include "tool.h"

namespace kmtool {

// A text of aligned lines, "name  value".
class table {
 public:
  // row: adds a line; `note` is set off behind the value.
  table& row(const std::string& name, const std::string& value);
  std::string text(const std::string& indent = "  ") const;

 private:
  std::vector<std::pair<std::string, std::string>> rows_;
};

// list_params: one row a tag, in order of first occurrence; values of repeated tags side by side.
table list_params(const keymaster::client::param_set& params);

// params_to_json: an object with one member a tag, named as tag_name() does. Tags that may repeat,
// and tags that do, give arrays. Enumerations and dates are texts, integers numbers, bytes
// hexadecimal text.
json params_to_json(const keymaster::client::param_set& params);

}  // namespace kmtool
