// The JSON documents of the device folder. What is wrong with one becomes device_error DAMAGED.
#pragma once

#include <cstdint>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>

#include "tee/device/device.h"

namespace tee {

using json = nlohmann::ordered_json;

// parse_json: the document in `text`; `path` is what errors name.
json parse_json(std::string_view text, const std::string& path);

// to_file_text: the document as it stands in a file, for people too.
std::string to_file_text(const json& document);

// json_number, json_text, json_flag: the value of a member of the object `document`. A number that
// is negative or above `limit` is wrong, like a value of another type.
uint64_t json_number(const json& document, const char* name, uint64_t limit,
                     const std::string& path);
std::string json_text(const json& document, const char* name, const std::string& path);
bool json_flag(const json& document, const char* name, const std::string& path);

}  // namespace tee
