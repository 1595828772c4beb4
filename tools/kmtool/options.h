// Options that several verbs have.
#pragma once

#include <CLI/CLI.hpp>
#include <optional>
#include <string>
#include <vector>

#include "keymaster/client/session.h"

namespace kmtool {

// add_number: an option that takes an unsigned number, decimal or hexadecimal with 0x (a leading
// zero is no octal: versions are written with them).
CLI::Option* add_number(CLI::App* verb, const std::string& name, std::optional<uint32_t>* target,
                        const std::string& help);
CLI::Option* add_number(CLI::App* verb, const std::string& name, std::optional<uint64_t>* target,
                        const std::string& help);

// add_names: an option that takes a comma-separated list of an enumeration tag's names or numbers;
// add_name takes one of them.
CLI::Option* add_names(CLI::App* verb, const std::string& name, keymaster::keymaster_tag_t tag,
                       std::vector<uint32_t>* target, const std::string& help);
CLI::Option* add_name(CLI::App* verb, const std::string& name, keymaster::keymaster_tag_t tag,
                      std::optional<uint32_t>* target, const std::string& help);

// names_of: the names of a tag's values, with spaces between them.
std::string names_of(keymaster::keymaster_tag_t tag);

// What a key was bound to; empty where the option was not given.
struct application_options {
  std::string id;
  std::string data;

  void add_to(CLI::App* verb);
  keymaster::client::application get() const;
};

}  // namespace kmtool
