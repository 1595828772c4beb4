// Parsing of options. A CLI::ValidationError names the option and what it takes.
#include "options.h"

#include <limits>
#include <sstream>

#include "keymaster/client/names.h"

namespace kmtool {

using namespace keymaster;

namespace {

template <typename T>
CLI::Option* add_unsigned(CLI::App* verb, const std::string& name, std::optional<T>* target,
                          const std::string& help) {
  constexpr T LARGEST = std::numeric_limits<T>::max();
  auto parse = [name, target](const std::string& text) {
    std::optional<uint64_t> number = client::parse_number(text);
    if (!number || *number > LARGEST) {
      throw CLI::ValidationError(
          name, "'" + text + "' is not a number from 0 to " + std::to_string(LARGEST));
    }
    *target = static_cast<T>(*number);
  };
  return verb->add_option_function<std::string>(name, parse, help)->type_name("N");
}

uint32_t parse_name(const std::string& option, keymaster_tag_t tag, const std::string& text) {
  std::optional<uint32_t> value = client::parse_value(tag, text);
  if (!value) throw CLI::ValidationError(option, "'" + text + "' is none of: " + names_of(tag));
  return *value;
}

}  // namespace

std::string names_of(keymaster_tag_t tag) {
  std::string list;
  for (std::string_view name : client::value_names(tag)) {
    list += (list.empty() ? "" : " ") + std::string(name);
  }
  return list;
}

CLI::Option* add_number(CLI::App* verb, const std::string& name, std::optional<uint32_t>* target,
                        const std::string& help) {
  return add_unsigned(verb, name, target, help);
}

CLI::Option* add_number(CLI::App* verb, const std::string& name, std::optional<uint64_t>* target,
                        const std::string& help) {
  return add_unsigned(verb, name, target, help);
}

CLI::Option* add_names(CLI::App* verb, const std::string& name, keymaster_tag_t tag,
                       std::vector<uint32_t>* target, const std::string& help) {
  auto parse = [name, tag, target](const std::string& list) {
    std::istringstream items(list + ",");
    for (std::string item; std::getline(items, item, ',');) {
      target->push_back(parse_name(name, tag, item));
    }
  };
  return verb->add_option_function<std::string>(name, parse, help + ": " + names_of(tag))
      ->type_name("LIST");
}

CLI::Option* add_name(CLI::App* verb, const std::string& name, keymaster_tag_t tag,
                      std::optional<uint32_t>* target, const std::string& help) {
  auto parse = [name, tag, target](const std::string& text) {
    *target = parse_name(name, tag, text);
  };
  return verb->add_option_function<std::string>(name, parse, help + ": " + names_of(tag))
      ->type_name("NAME");
}

void application_options::add_to(CLI::App* verb) {
  auto not_empty = [](const std::string& text) -> std::string {
    return text.empty() ? "an empty text binds to nothing; leave the option out" : "";
  };
  verb->add_option("--app-id", id, "Application id that the key is bound to")
      ->type_name("TEXT")
      ->check(not_empty);
  verb->add_option("--app-data", data, "Application data that the key is bound to")
      ->type_name("TEXT")
      ->check(not_empty);
}

client::application application_options::get() const {
  return {client::copy_of(client::as_bytes(id)), client::copy_of(client::as_bytes(data))};
}

}  // namespace kmtool
