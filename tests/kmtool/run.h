// Runs the built kmtool in a folder of its own.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

// What a call left behind. A call that does not end in a minute is killed: exit code -1.
struct call_result {
  int exit_code;
  std::string out;
  std::string err;
};

// sandbox: a temporary folder with a home for a device; it and all in it are gone at the end.
class sandbox {
 public:
  sandbox();
  sandbox(const sandbox&) = delete;
  sandbox& operator=(const sandbox&) = delete;
  ~sandbox();

  // run: kmtool with these arguments; the default device is the sandbox's folder "device".
  call_result run(const std::vector<std::string>& arguments, const std::string& input = "") const;

  std::string path(const std::string& name) const { return folder_ / name; }
  std::string read(const std::string& name) const;
  void write(const std::string& name, const std::string& content) const;

  // files: names of all files in the sandbox's top level, sorted.
  std::vector<std::string> files() const;

 private:
  std::filesystem::path folder_;
};
