// See run.h.
#include "run.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <sys/wait.h>

sandbox::sandbox() {
  std::string name = (std::filesystem::temp_directory_path() / "kmtool-test.XXXXXX").string();
  if (!mkdtemp(name.data())) abort();
  folder_ = name;
}

sandbox::~sandbox() {
  std::error_code ignored;
  std::filesystem::remove_all(folder_, ignored);
}

int sandbox::shell(const std::string& line) const {
  const int status = std::system(("cd '" + path("") + "' && " + line).c_str());
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string sandbox::command(const words& arguments) {
  std::string line =
      "env -u TEE_TA_PATH TEE_TRACE_LEVEL=0 KEYMASTER_DEVICE=\"$PWD/device\" "
      "timeout 300 " KMTOOL_PROGRAM;
  for (const std::string& argument : arguments)
    line += " '" + argument + "'";
  return line;
}

call_result sandbox::run(const words& arguments, const std::string& input) const {
  write(".in", input);
  const int exit_code = shell(command(arguments) + " <.in >.out 2>.err");
  return {exit_code, read(".out"), read(".err")};
}

json sandbox::run_json(words arguments, const std::string& input) const {
  arguments.insert(arguments.begin(), "--json");
  return json::parse(out_of(arguments, input));
}

void sandbox::expect(const words& arguments, int exit_code, const std::string& message) const {
  const call_result result = run(arguments);
  const std::string said = (exit_code == DONE ? result.out : "") + result.err;
  EXPECT_EQ(result.exit_code, exit_code) << testing::PrintToString(arguments) << result.err;
  EXPECT_NE(said.find(message), std::string::npos) << testing::PrintToString(arguments) << said;
}

void sandbox::expect_done(words arguments, const words& more) const {
  arguments.insert(arguments.end(), more.begin(), more.end());
  expect(arguments, DONE);
}

void sandbox::expect_all(int exit_code, const std::vector<failing_call>& calls) const {
  const words before = files();
  for (const failing_call& call : calls)
    expect(call.arguments, exit_code, call.message);
  EXPECT_EQ(files(), before);
}

std::string sandbox::read(const std::string& name) const {
  std::ifstream file(folder_ / name, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

void sandbox::write(const std::string& name, const std::string& content) const {
  std::ofstream(folder_ / name, std::ios::binary) << content;
}

words sandbox::files() const {
  words names;
  for (const auto& entry : std::filesystem::directory_iterator(folder_)) {
    std::string name = entry.path().filename();
    if (!name.starts_with('.') && name != "device") names.push_back(name);
  }
  std::ranges::sort(names);
  return names;
}
