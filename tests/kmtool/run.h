// The fixture of the tests of the command line: runs the built kmtool in a folder of its own.
#pragma once

#include <filesystem>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

using nlohmann::json;
using words = std::vector<std::string>;

enum { DONE, REFUSED, WRONG_USAGE, TEE_FAILED };

// What a call left behind. A call that does not end in a minute is killed: exit code 124.
struct call_result {
  int exit_code;
  std::string out;
  std::string err;
};

// A call and what it says when it fails.
struct failing_call {
  words arguments;
  std::string message;
};

// sandbox: a temporary folder with a home for a device; it and all in it are gone at the end.
class sandbox : public testing::Test {
 protected:
  sandbox();
  ~sandbox() override;

  // shell: the exit code of a shell's line in the sandbox.
  int shell(const std::string& line) const;

  // command: kmtool with these arguments as a line of the shell, none with a single quote in it;
  // the default device is the sandbox's folder "device".
  static std::string command(const words& arguments);
  call_result run(const words& arguments, const std::string& input = "") const;
  std::string out_of(const words& arguments, const std::string& input = "") const {
    return run(arguments, input).out;
  }
  json run_json(words arguments, const std::string& input = "") const;

  // expect: a call with that exit code which says `message`: on standard error unless it is done.
  void expect(const words& arguments, int exit_code, const std::string& message = "") const;
  // expect_done: a call of which nothing but success matters here, `more` being its last words.
  void expect_done(words arguments, const words& more = {}) const;
  // expect_all: calls that all end with `exit_code` and leave no file behind.
  void expect_all(int exit_code, const std::vector<failing_call>& calls) const;

  std::string path(const std::string& name) const { return folder_ / name; }
  std::string read(const std::string& name) const;
  void write(const std::string& name, const std::string& content) const;

  // files: names of all files in the sandbox's top level, sorted.
  words files() const;

 private:
  std::filesystem::path folder_;
};
