// Which files a call names. An option's role is the name of its validator.
#include "operands.h"

#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

#include "tool.h"

namespace kmtool {

namespace {

constexpr char STANDARD_STREAM[] = "-";
constexpr char INPUT[] = "input";
constexpr char OUTPUT[] = "output";
constexpr char REPLACEMENT[] = "replacement";

struct operand {
  std::string name;  // as the command line gives it
  std::string path;
  std::string role;
  bool given;  // else it is the default

  bool is_output() const { return role != INPUT; }
  bool is_stream() const { return path == STANDARD_STREAM; }
};

CLI::Option* add_file(CLI::App* verb, const std::string& name, std::string* path,
                      const std::string& help, const char* role) {
  auto not_empty = [](const std::string& text) -> std::string {
    return text.empty() ? "the path is empty" : "";
  };
  return verb->add_option(name, *path, help)
      ->type_name("FILE")
      ->default_str(*path)
      ->check(CLI::Validator(not_empty, "", role));
}

std::string role_of(CLI::Option* option) {
  for (const char* role : {INPUT, OUTPUT, REPLACEMENT}) {
    try {
      option->get_validator(role);
      return role;
    } catch (const CLI::OptionNotFound&) {
      continue;
    }
  }
  return "";
}

void collect(const CLI::App& app, std::vector<operand>* found) {
  for (const CLI::Option* option : app.get_options()) {
    const std::string role = role_of(const_cast<CLI::Option*>(option));
    const bool given = option->count() > 0;
    const std::string path = given ? option->results().front() : option->get_default_str();
    if (!role.empty() && !path.empty()) found->push_back({option->get_name(), path, role, given});
  }
  for (const CLI::App* verb : app.get_subcommands())
    collect(*verb, found);
}

void check_pair(const operand& one, const operand& other) {
  const std::string both = one.name + " and " + other.name + " ";
  if (one.is_stream() && other.is_stream() && one.is_output() == other.is_output()) {
    throw failure(WRONG_USAGE,
                  both + "both want standard " + (one.is_output() ? "output" : "input"));
  }
  const bool replaces = one.role == REPLACEMENT || other.role == REPLACEMENT;
  const bool reads_both = !one.is_output() && !other.is_output();
  if (replaces || reads_both || !same_file(one.path, other.path)) return;
  throw failure(WRONG_USAGE, both + "are the same file: " + one.path);
}

void check_standard_output(const operand& output, bool as_json) {
  if (as_json) {
    throw failure(WRONG_USAGE, "--json and " + output.name + " - both want standard output",
                  "Give " + output.name + " FILE.");
  }
  if (!output.given && isatty(STDOUT_FILENO) != 0) {
    throw failure(
        WRONG_USAGE, "the result is binary, and standard output is a terminal",
        "Give " + output.name + " FILE, or " + output.name + " - to have it there all the same.");
  }
}

}  // namespace

CLI::Option* add_input(CLI::App* verb, const std::string& name, std::string* path,
                       const std::string& help) {
  return add_file(verb, name, path, help, INPUT);
}

CLI::Option* add_output(CLI::App* verb, const std::string& name, std::string* path,
                        const std::string& help) {
  return add_file(verb, name, path, help, OUTPUT);
}

CLI::Option* add_replacement(CLI::App* verb, const std::string& name, std::string* path,
                             const std::string& help) {
  return add_file(verb, name, path, help, REPLACEMENT);
}

void check_operands(const CLI::App& app, bool as_json) {
  std::vector<operand> operands;
  collect(app, &operands);
  for (auto one = operands.begin(); one != operands.end(); ++one) {
    for (auto other = one + 1; other != operands.end(); ++other)
      check_pair(*one, *other);
    if (one->is_output() && one->is_stream()) check_standard_output(*one, as_json);
  }
}

bool same_file(const std::string& path, const std::string& other) {
  if (path == STANDARD_STREAM || other == STANDARD_STREAM) return false;
  struct stat one {};
  struct stat two {};
  const bool there = stat(path.c_str(), &one) == 0;
  const bool other_there = stat(other.c_str(), &two) == 0;
  if (there != other_there) return false;
  if (there) return S_ISREG(one.st_mode) && one.st_dev == two.st_dev && one.st_ino == two.st_ino;
  std::error_code ignored;
  namespace fs = std::filesystem;
  return fs::weakly_canonical(path, ignored) == fs::weakly_canonical(other, ignored);
}

}  // namespace kmtool
