// See run.h.
#include "run.h"

#include <algorithm>
#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <signal.h>
#include <sstream>
#include <sys/wait.h>
#include <unistd.h>

namespace {

// In the child: standard streams to files, the sandbox as working folder, kmtool in its place.
[[noreturn]] void become_kmtool(const std::filesystem::path& folder, const words& arguments) {
  std::vector<char*> argv = {const_cast<char*>(KMTOOL_PROGRAM)};
  for (const std::string& argument : arguments)
    argv.push_back(const_cast<char*>(argument.c_str()));
  argv.push_back(nullptr);
  if (chdir(folder.c_str()) != 0) _exit(99);
  setenv("KEYMASTER_DEVICE", (folder / "device").c_str(), 1);
  setenv("TEE_TRACE_LEVEL", "0", 1);
  unsetenv("TEE_TA_PATH");
  constexpr int NEW = O_WRONLY | O_CREAT | O_TRUNC;
  dup2(open(".in", O_RDONLY), STDIN_FILENO);
  dup2(open(".out", NEW, 0600), STDOUT_FILENO);
  dup2(open(".err", NEW, 0600), STDERR_FILENO);
  alarm(60);
  execv(KMTOOL_PROGRAM, argv.data());
  _exit(99);
}

}  // namespace

sandbox::sandbox() {
  std::string name = (std::filesystem::temp_directory_path() / "kmtool-test.XXXXXX").string();
  if (!mkdtemp(name.data())) abort();
  folder_ = name;
}

sandbox::~sandbox() {
  std::error_code ignored;
  std::filesystem::remove_all(folder_, ignored);
}

call_result sandbox::run(const words& arguments, const std::string& input) const {
  write(".in", input);
  pid_t child = fork();
  if (child == 0) become_kmtool(folder_, arguments);
  int status = 0;
  waitpid(child, &status, 0);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, read(".out"), read(".err")};
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
  std::ostringstream content;
  content << std::ifstream(folder_ / name, std::ios::binary).rdbuf();
  return content.str();
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
