// The files that a call names: what each is for, and what they cannot be at once.
#pragma once

#include <CLI/CLI.hpp>
#include <string>

namespace kmtool {

// add_input, add_output: an option or operand that names a file; "-" is standard input or output,
// and `*path` as it stands is the default (empty: none, unless the option is required). An empty
// path on the command line is wrong usage.
CLI::Option* add_input(CLI::App* verb, const std::string& name, std::string* path,
                       const std::string& help);
CLI::Option* add_output(CLI::App* verb, const std::string& name, std::string* path,
                        const std::string& help);

// add_replacement: an output that may be the file that the verb reads.
CLI::Option* add_replacement(CLI::App* verb, const std::string& name, std::string* path,
                             const std::string& help);

// check_operands: throws failure (WRONG_USAGE) when two files of the call want the same standard
// stream, when an output is the same file as another operand, when --json and data both want
// standard output, and when data would go to a terminal unasked.
void check_operands(const CLI::App& app, bool as_json);

// same_file: whether two paths lead to one regular file, there or yet to be made.
bool same_file(const std::string& path, const std::string& other);

}  // namespace kmtool
