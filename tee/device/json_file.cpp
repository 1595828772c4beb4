// The JSON documents of the device folder.
#include "tee/device/json_file.h"

namespace tee {

namespace {

[[noreturn]] void throw_damaged(const std::string& path, const std::string& what) {
  throw device_error(device_error::kind::DAMAGED, path + ": " + what);
}

const json& member(const json& document, const char* name, const std::string& path) {
  if (!document.is_object() || !document.contains(name)) {
    throw_damaged(path, std::string(name) + " is missing");
  }
  return document.at(name);
}

}  // namespace

json parse_json(std::string_view text, const std::string& path) {
  try {
    return json::parse(text);
  } catch (const json::parse_error& error) {
    throw_damaged(path, "is no JSON from byte " + std::to_string(error.byte) + " on");
  }
}

std::string to_file_text(const json& document) {
  return document.dump(2) + "\n";
}

uint64_t json_number(const json& document, const char* name, uint64_t limit,
                     const std::string& path) {
  const json& value = member(document, name, path);
  if (!value.is_number_unsigned() || value.get<uint64_t>() > limit) {
    throw_damaged(path, std::string(name) + " is not a number in range");
  }
  return value.get<uint64_t>();
}

std::string json_text(const json& document, const char* name, const std::string& path) {
  const json& value = member(document, name, path);
  if (!value.is_string()) throw_damaged(path, std::string(name) + " is not a text");
  return value.get<std::string>();
}

bool json_flag(const json& document, const char* name, const std::string& path) {
  const json& value = member(document, name, path);
  if (!value.is_boolean()) throw_damaged(path, std::string(name) + " is neither true nor false");
  return value.get<bool>();
}

}  // namespace tee
